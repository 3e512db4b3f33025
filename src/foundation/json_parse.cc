#include "foundation/json_parse.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string_view>
#include <unordered_set>
#include <vector>

#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

namespace HoxConfigManager::detail {
namespace {

// Forwards SAX events to the document and refuses nesting beyond the limit.
class DepthLimitedBuilder {
 public:
  explicit DepthLimitedBuilder(Document& doc) : doc_(doc) {}

  bool Null() { return doc_.Null(); }
  bool Bool(bool b) { return doc_.Bool(b); }
  bool Int(int i) { return doc_.Int(i); }
  bool Uint(unsigned u) { return doc_.Uint(u); }
  bool Int64(int64_t i) { return doc_.Int64(i); }
  bool Uint64(uint64_t u) { return doc_.Uint64(u); }
  bool Double(double d) { return doc_.Double(d); }
  // Numbers arrive as their text: the reader's own conversion reads some
  // decimals as a neighbouring double (0.30000000000000004, 7e22), and its
  // exact conversion misreads a zero with a large exponent. Integers are kept
  // as the reader would keep them; other numbers are rounded correctly, so a
  // value reads back from the text the library writes for it.
  bool RawNumber(const char* s, rapidjson::SizeType n, bool /*copy*/) {
    const char* const end = s + n;
    const bool negative = *s == '-';
    const char* const digits = negative ? s + 1 : s;
    if (std::none_of(digits, end, [](char c) { return c == '.' || c == 'e' || c == 'E'; })) {
      std::uint64_t u = 0;
      const auto [stop, error] = std::from_chars(digits, end, u);
      if (error == std::errc() && stop == end) {
        if (!negative) return u <= 0xFFFFFFFFu ? doc_.Uint(static_cast<unsigned>(u)) : doc_.Uint64(u);
        if (u <= 0x80000000u) return doc_.Int(static_cast<int>(-static_cast<std::int64_t>(u)));
        if (u <= 0x8000000000000000u) return doc_.Int64(static_cast<std::int64_t>(~u + 1));
      }
    }
    double d = 0;
    const auto [stop, error] = std::from_chars(s, end, d);
    if (error == std::errc() && stop == end) return doc_.Double(d);
    // Out of range: beyond the largest double is refused, as the reader
    // refuses it; below the smallest reads as zero (or the nearest
    // subnormal), as the reader reads it.
    long double wide = 0;
    const auto [wideStop, wideError] = std::from_chars(s, end, wide);
    const bool tooBig = wideError == std::errc() && wideStop == end
                            ? std::fabs(wide) > std::numeric_limits<double>::max()
                            : LargeExponent(digits, end);
    if (tooBig) {
      numberTooBig_ = true;
      return false;
    }
    return doc_.Double(wideError == std::errc() ? static_cast<double>(wide) : (negative ? -0.0 : 0.0));
  }
  bool String(const char* s, rapidjson::SizeType n, bool copy) { return Text(s, n) && doc_.String(s, n, copy); }
  bool StartObject() { return Enter() && doc_.StartObject(); }
  bool Key(const char* s, rapidjson::SizeType n, bool copy) { return Text(s, n) && doc_.Key(s, n, copy); }
  bool EndObject(rapidjson::SizeType n) {
    --depth_;
    return doc_.EndObject(n);
  }
  bool StartArray() { return Enter() && doc_.StartArray(); }
  bool EndArray(rapidjson::SizeType n) {
    --depth_;
    return doc_.EndArray(n);
  }
  bool TooDeep() const { return tooDeep_; }
  bool LoneSurrogate() const { return loneSurrogate_; }
  bool NumberTooBig() const { return numberTooBig_; }

 private:
  bool Enter() {
    if (++depth_ > kMaxJsonDepth) {
      tooDeep_ = true;
      return false;
    }
    return true;
  }
  // The reader turns an escaped low surrogate without its high one
  // ("\udc00") into the bytes of a surrogate, which are not UTF-8: the
  // document would not read back from its own text. Such bytes (0xED then
  // 0xA0 or more) come only from escapes: raw text is checked as UTF-8, or
  // is ASCII.
  bool Text(const char* s, rapidjson::SizeType n) {
    for (const char* p = s; (p = static_cast<const char*>(std::memchr(p, 0xED, s + n - p))) != nullptr; ++p) {
      if (p + 1 < s + n && static_cast<unsigned char>(p[1]) >= 0xA0) {
        loneSurrogate_ = true;
        return false;
      }
    }
    return true;
  }

  // For a number even a long double cannot hold: whether it is huge rather
  // than tiny ("1e99999" rather than "1e-99999" or "0.000…1").
  static bool LargeExponent(const char* digits, const char* end) {
    const char* e = std::find_if(digits, end, [](char c) { return c == 'e' || c == 'E'; });
    if (e != end) return e + 1 == end || e[1] != '-';
    return *digits != '0';
  }

  Document& doc_;
  unsigned depth_ = 0;
  bool tooDeep_ = false;
  bool numberTooBig_ = false;
  bool loneSurrogate_ = false;
};

// Numbers as text, converted by the builder: a number must read back as the
// value whose text the library wrote (the store keeps values as text).
constexpr unsigned kParseFlags =
    rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag | rapidjson::kParseNumbersAsStringsFlag;
// Pure ASCII text is valid UTF-8 by definition; checking it a word at a time
// is far cheaper than the reader's per-character validation, which dominates
// the parsing of the store's many small values.
constexpr unsigned kAsciiParseFlags = rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag;

// Objects this small are checked for repeated names pair by pair.
constexpr rapidjson::SizeType kPairwiseMembers = 8;

bool HasRepeatedName(const Value& object) {
  const rapidjson::SizeType count = object.MemberCount();
  if (count < 2) return false;
  const auto name = [](const Value& n) { return std::string_view(n.GetString(), n.GetStringLength()); };
  if (count <= kPairwiseMembers) {
    for (auto i = object.MemberBegin(); i != object.MemberEnd(); ++i) {
      for (auto j = i + 1; j != object.MemberEnd(); ++j) {
        if (name(i->name) == name(j->name)) return true;
      }
    }
    return false;
  }
  std::unordered_set<std::string_view> seen;
  seen.reserve(count);
  for (auto it = object.MemberBegin(); it != object.MemberEnd(); ++it) {
    if (!seen.insert(name(it->name)).second) return true;
  }
  return false;
}

// True when some object below `value` names a member twice. The nesting
// limit bounds the recursion.
bool HasRepeatedNames(const Value& value) {
  if (value.IsObject()) {
    if (HasRepeatedName(value)) return true;
    for (auto it = value.MemberBegin(); it != value.MemberEnd(); ++it) {
      if (HasRepeatedNames(it->value)) return true;
    }
  } else if (value.IsArray()) {
    for (const Value& element : value.GetArray()) {
      if (HasRepeatedNames(element)) return true;
    }
  }
  return false;
}

// Reads the text again to find the first repeated member name in text order;
// the reader stops just after it. Run only once a repeat is known to exist.
class RepeatFinder : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, RepeatFinder> {
 public:
  bool StartObject() {
    names_.emplace_back();
    return true;
  }
  bool Key(const char* s, rapidjson::SizeType n, bool) {
    if (names_.back().emplace(s, n).second) return true;
    repeated_.assign(s, n);
    return false;
  }
  bool EndObject(rapidjson::SizeType) {
    names_.pop_back();
    return true;
  }
  const std::string& Repeated() const { return repeated_; }

 private:
  std::vector<std::unordered_set<std::string>> names_;
  std::string repeated_;
};

bool IsAscii(const char* text, std::size_t size) {
  std::size_t i = 0;
  for (; i + sizeof(std::uint64_t) <= size; i += sizeof(std::uint64_t)) {
    std::uint64_t word;
    std::memcpy(&word, text + i, sizeof word);
    if ((word & 0x8080808080808080ull) != 0) return false;
  }
  for (; i < size; ++i) {
    if (static_cast<unsigned char>(text[i]) >= 0x80) return false;
  }
  return true;
}

// The reader's message as a clause: "Missing a comma." -> "missing a comma".
std::string Clause(const char* message) {
  std::string text(message);
  if (!text.empty() && text.back() == '.') text.pop_back();
  if (!text.empty() && text[0] >= 'A' && text[0] <= 'Z') text[0] = static_cast<char>(text[0] - 'A' + 'a');
  return text;
}

// Line and column of `offset`: columns count characters, so UTF-8
// continuation bytes do not advance them.
void Locate(const char* text, std::size_t size, std::size_t offset, ErrorLocation& where) {
  offset = std::min(offset, size);
  where.offset = offset;
  where.line = 1;
  where.column = 1;
  for (std::size_t i = 0; i < offset; ++i) {
    const auto c = static_cast<unsigned char>(text[i]);
    if (c == '\n') {
      ++where.line;
      where.column = 1;
    } else if ((c & 0xC0) != 0x80) {
      ++where.column;
    }
  }
}

}  // namespace

bool ParseJson(const char* text, std::size_t size, Document& doc, std::string* error) {
  ErrorLocation where;
  if (ParseJson(text, size, doc, &where)) return true;
  if (error != nullptr) *error = where.reason + " at offset " + std::to_string(where.offset);
  return false;
}

bool ParseJson(const char* text, std::size_t size, Document& doc, ErrorLocation* where) {
  bool ok = false;
  bool tooDeep = false;
  bool numberTooBig = false;
  bool loneSurrogate = false;
  bool trailingNul = false;
  bool repeat = false;
  std::string repeated;
  rapidjson::ParseResult result;
  auto generator = [&](Document& target) {
    DepthLimitedBuilder builder(target);
    rapidjson::MemoryStream stream(text, size);
    rapidjson::Reader reader;
    result = IsAscii(text, size) ? reader.Parse<kAsciiParseFlags>(stream, builder)
                                 : reader.Parse<kParseFlags>(stream, builder);
    tooDeep = builder.TooDeep();
    numberTooBig = builder.NumberTooBig();
    loneSurrogate = builder.LoneSurrogate();
    ok = !result.IsError();
    // The reader takes a NUL byte for the end of the text: a document
    // followed by a NUL and anything else must not pass as that document.
    if (ok && stream.Tell() != size) {
      trailingNul = true;
      result.Set(rapidjson::kParseErrorDocumentRootNotSingular, stream.Tell());
      ok = false;
    }
    return ok;
  };
  doc.Populate(generator);
  // A member named twice would be read as the one or the other depending on
  // who looks; the text is refused instead.
  if (ok && HasRepeatedNames(doc)) {
    RepeatFinder finder;
    rapidjson::MemoryStream stream(text, size);
    result = rapidjson::Reader().Parse<rapidjson::kParseIterativeFlag>(stream, finder);
    repeated = finder.Repeated();
    repeat = true;
    ok = false;
  }
  if (!ok && where != nullptr) {
    where->reason = tooDeep        ? "nesting deeper than " + std::to_string(kMaxJsonDepth) + " levels"
                    : numberTooBig ? Clause(rapidjson::GetParseError_En(rapidjson::kParseErrorNumberTooBig))
                    : loneSurrogate ? Clause(rapidjson::GetParseError_En(rapidjson::kParseErrorStringUnicodeSurrogateInvalid))
                    : trailingNul  ? std::string("a NUL byte after the document")
                    : repeat       ? "member \"" + repeated + "\" appears twice in one object"
                                   : Clause(rapidjson::GetParseError_En(result.Code()));
    Locate(text, size, result.Offset(), *where);
  }
  if (!ok) doc.SetNull();
  return ok;
}

}  // namespace HoxConfigManager::detail
