// Matching of desired instances (or array elements) to host positions, as
// the drift walk needs it: each desired entry, in desired order, takes the
// first unmatched host position that matches it, in host order. Internal to
// the drift engine; not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>
#include <vector>

#include <hoxcm/json.h>

#include "foundation/compare/value_compare.h"

namespace HoxConfigManager::detail {

using rapidjson::SizeType;
constexpr SizeType kNone = static_cast<SizeType>(-1);

// Host positions grouped by a key, each group in ascending host order; the
// first unmatched position of a key is found without scanning the others.
// An open-addressing table: one probe sequence in a flat array per lookup,
// which matters when a key holds a hundred thousand instances.
template <typename Key>
class PositionIndex {
 public:
  explicit PositionIndex(SizeType size) : next_(size, kNone) {
    std::size_t capacity = 16;
    while (capacity < 2 * static_cast<std::size_t>(size)) capacity *= 2;
    slots_.resize(capacity);
    mask_ = capacity - 1;
  }
  void Insert(const Key& key, SizeType position) {
    const std::uint64_t hash = HashOf(key);
    Slot& slot = Probe(key, hash);
    if (slot.tail == kNone) {
      slot.key = key;
      slot.hash = hash;
      slot.head = slot.tail = position;
    } else {
      next_[slot.tail] = position;
      slot.tail = position;
    }
  }
  // Calls `accept(position)` on the unmatched positions of `key` in host
  // order until it returns true; that position is then matched.
  template <typename Accept>
  SizeType TakeFirst(const Key& key, std::vector<bool>& matched, Accept&& accept) {
    Slot& slot = Probe(key, HashOf(key));
    SizeType& head = slot.head;
    if (head == kNone) return kNone;
    while (head != kNone && matched[head]) head = next_[head];  // skip what is taken
    for (SizeType p = head; p != kNone; p = next_[p]) {
      if (!matched[p] && accept(p)) {
        matched[p] = true;
        return p;
      }
    }
    return kNone;
  }

  // Latency hiding for lookups in random order: fetch the slot of a key
  // that will be looked up soon, and, once it is fetched, guess the host
  // position it leads to (by hash only, without reading the key).
  void PrefetchSlot(const Key& key) const { __builtin_prefetch(&slots_[HashOf(key) & mask_]); }
  SizeType Peek(const Key& key) const {
    const std::uint64_t hash = HashOf(key);
    for (std::size_t i = hash & mask_; slots_[i].tail != kNone; i = (i + 1) & mask_) {
      if (slots_[i].hash == hash) return slots_[i].head;
    }
    return kNone;
  }

 private:
  struct Slot {
    Key key{};
    std::uint64_t hash = 0;
    SizeType head = kNone;
    SizeType tail = kNone;
  };
  static std::uint64_t HashOf(std::string_view key) { return compare::HashBytes(key); }
  static std::uint64_t HashOf(std::uint64_t key) { return compare::Mix(key); }
  static bool SameKey(std::string_view a, std::string_view b) { return compare::SameBytes(a, b); }
  static bool SameKey(std::uint64_t a, std::uint64_t b) { return a == b; }

  // The slot holding `key`, or the empty slot where it belongs. A group
  // whose positions are all matched keeps its slot, so probing stays valid.
  Slot& Probe(const Key& key, std::uint64_t hash) {
    for (std::size_t i = hash & mask_;; i = (i + 1) & mask_) {
      Slot& slot = slots_[i];
      if (slot.tail == kNone || (slot.hash == hash && SameKey(slot.key, key))) return slot;
    }
  }

  std::vector<Slot> slots_;
  std::size_t mask_ = 0;
  std::vector<SizeType> next_;
};

// Matches desired instances (or array elements), in desired order, to the
// first unmatched host position that matches each, in host order. Documents
// mostly list the same things in the same order, so the host position after
// the previous match (the cursor) is tried first, together with the few
// positions before it left unmatched ("holes"); the index by key is built
// only when that fails, and used alone once there are many holes.
template <typename Key, typename HostKey>
class HostMatcher {
 public:
  HostMatcher(SizeType size, HostKey hostKey) : matched_(size, false), hostKey_(std::move(hostKey)) {}

  // The host position matching the next desired entry, or kNone.
  // `matches(j)` tells whether host position j matches it; `desiredKey()`
  // gives the key that matching host positions share.
  template <typename Matches, typename DesiredKey>
  SizeType Take(Matches&& matches, DesiredKey&& desiredKey) {
    if (indexOnly_) return Index().TakeFirst(desiredKey(), matched_, matches);
    // Every unmatched position before the cursor is a hole, in ascending
    // order, so holes then cursor then the index visit host order.
    for (SizeType k : holes_) {
      if (!matched_[k] && matches(k)) return matched_[k] = true, k;
    }
    const SizeType size = static_cast<SizeType>(matched_.size());
    if (cursor_ < size && !matched_[cursor_] && matches(cursor_)) {
      matched_[cursor_] = true;
      return cursor_++;
    }
    const SizeType found = Index().TakeFirst(desiredKey(), matched_, matches);
    if (found != kNone && found >= cursor_) {
      for (SizeType k = cursor_; k < found; ++k) {
        if (!matched_[k]) holes_.push_back(k);
      }
      cursor_ = found + 1;
      indexOnly_ = holes_.size() > kMaxHoles;
    }
    return found;
  }
  const std::vector<bool>& matched() const { return matched_; }
  // Once only the index is used, callers may hide its latency (see
  // PositionIndex::PrefetchSlot and Peek).
  const PositionIndex<Key>* IndexOnly() const { return indexOnly_ ? &*index_ : nullptr; }

 private:
  static constexpr std::size_t kMaxHoles = 8;

  PositionIndex<Key>& Index() {
    if (!index_) {
      index_.emplace(static_cast<SizeType>(matched_.size()));
      for (SizeType j = 0; j < matched_.size(); ++j) index_->Insert(hostKey_(j), j);
    }
    return *index_;
  }

  std::vector<bool> matched_;
  HostKey hostKey_;
  std::vector<SizeType> holes_;
  SizeType cursor_ = 0;
  bool indexOnly_ = false;
  std::optional<PositionIndex<Key>> index_;
};

}  // namespace HoxConfigManager::detail
