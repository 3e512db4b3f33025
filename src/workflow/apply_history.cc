// The apply history: records as JSON rows of the store, the document's
// digest, and the pieces operations fill records with.
#include "workflow/apply_history.h"

#include <sha2.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <ctime>
#include <string_view>

#include <hoxcm/config_store.h>
#include <hoxcm/documents.h>
#include <hoxcm/host.h>

namespace HoxConfigManager {
namespace {

constexpr std::size_t kValueLimit = 256;

// The reason rules by their names in the record (ImpactReasonsToJson).
constexpr std::array<std::pair<ImpactReason::Rule, const char*>, 3> kRuleNames = {{
    {ImpactReason::Rule::kPropertyTrigger, "property"},
    {ImpactReason::Rule::kOperation, "operation"},
    {ImpactReason::Rule::kPlugin, "plugin"},
}};

// `text` cut to kValueLimit bytes, never inside a UTF-8 sequence.
std::string Cut(const std::string& text) {
  if (text.size() <= kValueLimit) return text;
  std::size_t end = kValueLimit;
  while (end > 0 && (static_cast<unsigned char>(text[end]) & 0xC0) == 0x80) --end;
  return text.substr(0, end) + "...";
}

// RapidJSON's output stream interface over a running SHA-256, so that a
// large document is hashed without being written out whole.
class Sha256Stream {
 public:
  using Ch = char;
  Sha256Stream() { SHA256Init(&context_); }
  void Put(char c) {
    buffer_[used_++] = static_cast<uint8_t>(c);
    if (used_ == buffer_.size()) Flush();
  }
  void Flush() {
    SHA256Update(&context_, buffer_.data(), used_);
    used_ = 0;
  }
  std::string Hex() {
    Flush();
    char hex[SHA256_DIGEST_STRING_LENGTH];
    SHA256End(&context_, hex);
    return hex;
  }

 private:
  SHA2_CTX context_;
  std::array<uint8_t, 65536> buffer_;
  std::size_t used_ = 0;
};

// Writing a record's JSON.
class RecordWriter {
 public:
  explicit RecordWriter(Document& out) : out_(out), a_(out.GetAllocator()) {}

  Value Text(const std::string& s) { return Value(s, a_); }
  Value Strings(const std::vector<std::string>& list) {
    Value array(rapidjson::kArrayType);
    for (const std::string& s : list) array.PushBack(Text(s), a_);
    return array;
  }
  Value Error(const ErrorInfo& e) {
    Value v(rapidjson::kObjectType);
    v.AddMember("id", Text(e.id), a_);
    v.AddMember("args", Strings(e.args), a_);
    v.AddMember("message", Text(e.message), a_);
    return v;
  }
  Value Verdict(const ApplyHistoryRecord& r) {
    Value v(rapidjson::kObjectType);
    v.AddMember("compliant", r.compliant, a_);
    v.AddMember("impact", static_cast<int>(r.impact), a_);
    Value statements(rapidjson::kArrayType);
    for (const ImpactInfo& info : r.statements) {
      Value s(rapidjson::kObjectType);
      s.AddMember("id", Text(info.id), a_);
      s.AddMember("args", Strings(info.args), a_);
      statements.PushBack(s, a_);
    }
    v.AddMember("statements", statements, a_);
    v.AddMember("statementsOmitted", static_cast<uint64_t>(r.statementsOmitted), a_);
    Value objects;
    ImpactReasonsToJson(ImpactReasons{r.reasons}, objects, a_);
    v.AddMember("objects", objects, a_);
    v.AddMember("objectsOmitted", static_cast<uint64_t>(r.reasonsOmitted), a_);
    return v;
  }
  void Write(const ApplyHistoryRecord& r) {
    out_.SetObject();
    if (r.sequence > 0) out_.AddMember("sequence", r.sequence, a_);
    out_.AddMember("kind", Text(r.kind), a_);
    out_.AddMember("startedAt", r.startedAt, a_);
    out_.AddMember("seconds", r.seconds, a_);
    out_.AddMember("document", Text(r.document), a_);
    if (r.judged) out_.AddMember("verdict", Verdict(r), a_);
    Value runs(rapidjson::kArrayType);
    for (const ApplyHistoryRun& run : r.runs) {
      Value v(rapidjson::kObjectType);
      v.AddMember("key", Text(run.key), a_);
      v.AddMember("plugin", Text(run.pluginId), a_);
      v.AddMember("inputs", static_cast<uint64_t>(run.inputs), a_);
      v.AddMember("seconds", run.seconds, a_);
      if (!run.outcome.id.empty()) v.AddMember("error", Error(run.outcome), a_);
      runs.PushBack(v, a_);
    }
    out_.AddMember("runs", runs, a_);
    out_.AddMember("outcome", Text(r.outcome), a_);
    out_.AddMember("status", static_cast<int>(r.status), a_);
    if (!r.error.id.empty()) out_.AddMember("error", Error(r.error), a_);
    if (r.errorCode != 0) {
      Value e(rapidjson::kObjectType);
      e.AddMember("code", r.errorCode, a_);
      e.AddMember("text", Text(r.errorText), a_);
      out_.AddMember("exception", e, a_);
    }
  }

 private:
  Document& out_;
  Allocator& a_;
};

// Reading it back. Every accessor asserts its member's type, and RapidJSON's
// assertions throw: a damaged record ends in an exception, never a crash.
std::vector<std::string> ReadStrings(const Value& array) {
  std::vector<std::string> list;
  for (const Value& s : array.GetArray()) list.push_back(s.GetString());
  return list;
}
std::string ReadOptional(const Value& object, const char* name) {
  const auto it = object.FindMember(name);
  return it == object.MemberEnd() ? std::string() : it->value.GetString();
}
ErrorInfo ReadError(const Value& v) { return {v["id"].GetString(), ReadStrings(v["args"]), v["message"].GetString()}; }
IMPACT_TYPE ReadImpact(const Value& v) {
  const int impact = v.GetInt();
  if (impact < IMPACT_NONE || impact > IMPACT_REBOOT_REQUIRED) detail::ThrowInvalidJson();
  return static_cast<IMPACT_TYPE>(impact);
}

ObjectImpact ReadObject(const Value& o) {
  ObjectImpact object;
  object.id = {o["component"].GetString(), o["group"].GetString(), o["key"].GetString(), o["instance"].GetString()};
  object.action = o["action"].GetString();
  object.impact = ReadImpact(o["impact"]);
  for (const Value& r : o["reasons"].GetArray()) {
    ImpactReason reason;
    const std::string rule = r["rule"].GetString();
    const auto named = std::find_if(kRuleNames.begin(), kRuleNames.end(),
                                    [&rule](const auto& entry) { return rule == entry.second; });
    if (named == kRuleNames.end()) detail::ThrowInvalidJson();
    reason.rule = named->first;
    reason.impact = ReadImpact(r["impact"]);
    reason.path = ReadOptional(r, "path");
    reason.oldValue = ReadOptional(r, "oldValue");
    reason.newValue = ReadOptional(r, "newValue");
    reason.plugin = ReadOptional(r, "plugin");
    reason.reason = ReadOptional(r, "reason");
    object.reasons.push_back(std::move(reason));
  }
  return object;
}

ApplyHistoryRecord ReadRecord(const Value& v) {
  ApplyHistoryRecord r;
  r.kind = v["kind"].GetString();
  r.startedAt = v["startedAt"].GetInt64();
  r.seconds = v["seconds"].GetDouble();
  r.document = v["document"].GetString();
  if (const auto verdict = v.FindMember("verdict"); verdict != v.MemberEnd()) {
    const Value& d = verdict->value;
    r.judged = true;
    r.compliant = d["compliant"].GetBool();
    r.impact = ReadImpact(d["impact"]);
    for (const Value& s : d["statements"].GetArray()) r.statements.push_back({s["id"].GetString(), ReadStrings(s["args"])});
    r.statementsOmitted = d["statementsOmitted"].GetUint64();
    for (const Value& o : d["objects"].GetArray()) r.reasons.push_back(ReadObject(o));
    r.reasonsOmitted = d["objectsOmitted"].GetUint64();
  }
  for (const Value& run : v["runs"].GetArray()) {
    ApplyHistoryRun entry{run["key"].GetString(), run["plugin"].GetString(), run["inputs"].GetUint64(), {},
                          run["seconds"].GetDouble()};
    if (run.HasMember("error")) entry.outcome = ReadError(run["error"]);
    r.runs.push_back(std::move(entry));
  }
  r.outcome = v["outcome"].GetString();
  const int status = v["status"].GetInt();
  if (status < APPLY_COMPLETED || status > APPLY_COMPLETED_IN_MAINTENANCE_MODE) detail::ThrowInvalidJson();
  r.status = static_cast<ApplyStatus>(status);
  if (v.HasMember("error")) r.error = ReadError(v["error"]);
  if (const auto e = v.FindMember("exception"); e != v.MemberEnd()) {
    r.errorCode = e->value["code"].GetInt();
    r.errorText = e->value["text"].GetString();
  }
  return r;
}

}  // namespace

std::string DocumentDigest(const Value& document) {
  Sha256Stream stream;
  rapidjson::Writer<Sha256Stream> writer(stream);
  document.Accept(writer);
  return "sha256:" + stream.Hex();
}

void ApplyHistoryRecordToJson(const ApplyHistoryRecord& record, Document& out) { RecordWriter(out).Write(record); }

void RecordVerdict(ApplyHistoryRecord& record, const ImpactResult& impact, const ImpactReasons& reasons) {
  record.judged = true;
  record.compliant = impact.compliant;
  record.impact = impact.impact;
  const std::size_t statements = std::min(impact.impactInfo.size(), kApplyHistoryListLimit);
  record.statements.assign(impact.impactInfo.begin(), impact.impactInfo.begin() + statements);
  record.statementsOmitted = impact.impactInfo.size() - statements;
  const std::size_t objects = std::min(reasons.objects.size(), kApplyHistoryListLimit);
  record.reasons.assign(reasons.objects.begin(), reasons.objects.begin() + objects);
  record.reasonsOmitted = reasons.objects.size() - objects;
  for (ObjectImpact& object : record.reasons) {
    for (ImpactReason& reason : object.reasons) {
      reason.oldValue = Cut(reason.oldValue);
      reason.newValue = Cut(reason.newValue);
    }
  }
}

std::vector<ApplyHistoryRun> HistoryRuns(const std::vector<GroupRun>& runs) {
  std::vector<ApplyHistoryRun> history;
  for (const GroupRun& run : runs) {
    history.push_back(
        {run.key, run.pluginId, run.inputCount, run.outcome, std::chrono::duration<double>(run.wall).count()});
  }
  return history;
}

void RecordResult(ApplyHistoryRecord& record, const ApplyResult& result, bool compliant) {
  record.status = result.status;
  record.error = result.errorInfo;
  const std::string& id = result.errorInfo.id;
  static constexpr std::string_view kAborted = ".plugin.aborted";
  if (result.status == APPLY_PENDING_REBOOT) {
    record.outcome = "staged";
  } else if (id.size() >= kAborted.size() && id.compare(id.size() - kAborted.size(), kAborted.size(), kAborted) == 0) {
    record.outcome = "aborted";
  } else if (!id.empty()) {
    record.outcome = "failed";
  } else {
    record.outcome = compliant ? "nothing to do" : "applied";
  }
}

void RecordException(ApplyHistoryRecord& record, const std::exception_ptr& error) {
  record.errorCode = -1;
  try {
    std::rethrow_exception(error);
  } catch (const HoxConfigStore::ConfigStoreException& e) {
    record.errorCode = e.GetErrorCode();
    record.errorText = e.what();
  } catch (const std::exception& e) {
    record.errorText = e.what();
  } catch (const ErrorInfo& e) {
    record.error = e;
  } catch (...) {
    record.errorText = "unknown exception";
  }
  const int code = record.errorCode;
  record.outcome = code == InvalidApplyInput || code == ImpactResultNotApplicable ||
                           code == HostNotInMaintenanceMode || code == PendingDesiredConfiguration
                       ? "refused"
                       : "error";
}

ApplyResult RecordOperation(const char* kind, ApplyHistoryRecord& record,
                            const std::function<ApplyResult(bool& nothingToDo)>& operation) {
  record.kind = kind;
  record.startedAt = static_cast<int64_t>(std::time(nullptr));
  const auto start = std::chrono::steady_clock::now();
  const auto append = [&record, &start] {
    record.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    AppendApplyHistoryOrLog(record);
  };
  try {
    bool nothingToDo = false;
    const ApplyResult result = operation(nothingToDo);
    RecordResult(record, result, nothingToDo);
    append();
    return result;
  } catch (...) {
    RecordException(record, std::current_exception());
    append();
    throw;
  }
}

int64_t AppendApplyHistory(const ApplyHistoryRecord& record, std::size_t keep) {
  Document json;
  ApplyHistoryRecordToJson(record, json);
  // The row's sequence is the record's: a stored one would only disagree.
  json.RemoveMember("sequence");
  return HoxConfigStore::AppendApplyHistoryRow(JsonToString(json), keep);
}

int64_t AppendApplyHistory(const ApplyHistoryRecord& record) { return AppendApplyHistory(record, kApplyHistoryLimit); }

void AppendApplyHistoryOrLog(const ApplyHistoryRecord& record) {
  try {
    AppendApplyHistory(record);
  } catch (const std::exception& e) {
    CSLogger::Log(CSLogger::kError, "Failed to append to the apply history: %s", e.what());
  }
}

std::vector<ApplyHistoryRecord> GetApplyHistory() {
  std::vector<ApplyHistoryRecord> records;
  for (const HoxConfigStore::ApplyHistoryRow& row : HoxConfigStore::GetApplyHistoryRows()) {
    ApplyHistoryRecord record;
    try {
      Document json;
      ParseDocument(row.record, json);
      record = ReadRecord(json);
    } catch (const std::exception& e) {
      CSLogger::Log(CSLogger::kError, "Apply history record %lld is unreadable: %s",
                    static_cast<long long>(row.sequence), e.what());
      record = ApplyHistoryRecord();
      record.outcome = "unreadable";
    }
    record.sequence = row.sequence;
    records.push_back(std::move(record));
  }
  return records;
}

}  // namespace HoxConfigManager
