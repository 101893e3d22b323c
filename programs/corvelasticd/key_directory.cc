#include "programs/corvelasticd/key_directory.h"

#include <algorithm>

namespace corvlumex {
namespace elasticd {
namespace {

constexpr uint64_t kMaxKeyLength = (1u << 24) - 2;
constexpr uint64_t kMaxOffset = (uint64_t{1} << 40) - 1;
constexpr int64_t kMaxRowid = int64_t{1} << 32;  // beyond: rows too sparse for a table by row

}  // namespace

bool KeyDirectory::Table::Set(int64_t rowid, const std::optional<std::string>& key) {
  if (rowid < 0 || rowid >= kMaxRowid) return false;
  const size_t index = static_cast<size_t>(rowid);
  if (index < lengths.size()) lengths[index] = kUnknownLength;
  if (index >= slots.size()) {
    if (!key) return true;
    slots.resize(std::max(index + 1, slots.size() + slots.size() / 2), 0);
  }
  if (slots[index] != 0) garbage += (slots[index] & 0xFFFFFF) - 1;
  slots[index] = 0;
  if (!key) return true;
  if (key->size() > kMaxKeyLength || arena.size() > kMaxOffset) return false;
  slots[index] = (static_cast<uint64_t>(arena.size()) << 24) | (key->size() + 1);
  arena += *key;
  if (garbage > (16u << 20) && garbage > arena.size() / 2) Compact();
  return true;
}

bool KeyDirectory::Table::SetLength(int64_t rowid, uint32_t length) {
  if (rowid < 0 || rowid >= kMaxRowid) return false;
  const size_t index = static_cast<size_t>(rowid);
  if (index >= lengths.size()) lengths.resize(std::max(index + 1, lengths.size() + lengths.size() / 2), kUnknownLength);
  lengths[index] = length;
  return true;
}

void KeyDirectory::Table::Compact() {
  std::string packed;
  packed.reserve(arena.size() - garbage);
  for (uint64_t& slot : slots) {
    if (slot == 0) continue;
    const size_t length = (slot & 0xFFFFFF) - 1;
    const uint64_t offset = packed.size();
    packed.append(arena, slot >> 24, length);
    slot = (offset << 24) | (length + 1);
  }
  arena.swap(packed);
  garbage = 0;
}

void KeyDirectory::BeginCommit() { generation_.fetch_add(1, std::memory_order_acq_rel); }

void KeyDirectory::EndCommit(bool committed, bool complete, const std::vector<Change>& changes) {
  std::unique_lock<std::shared_mutex> guard(mutex_);
  if (ready_.load(std::memory_order_relaxed)) {
    bool ok = committed && complete;
    for (size_t i = 0; ok && i < changes.size(); ++i) ok = table_.Set(changes[i].first, changes[i].second);
    if (!ok) {
      ready_.store(false, std::memory_order_release);
      table_ = Table();
    }
  }
  generation_.fetch_add(1, std::memory_order_acq_rel);
}

bool KeyDirectory::TryStartBuild() {
  std::lock_guard<std::mutex> guard(build_mutex_);
  if (building_ || ready()) return false;
  building_ = true;
  building_table_ = Table();
  building_ok_ = true;
  return true;
}

void KeyDirectory::Add(int64_t rowid, const std::string& key) {
  if (building_ok_) building_ok_ = building_table_.Set(rowid, key);
}

void KeyDirectory::AddLength(int64_t rowid, uint32_t length) {
  if (building_ok_) building_ok_ = building_table_.SetLength(rowid, length);
}

void KeyDirectory::FinishBuild(uint64_t at, bool complete) {
  {
    std::unique_lock<std::shared_mutex> guard(mutex_);
    if (complete && building_ok_ && at % 2 == 0 && generation_.load(std::memory_order_acquire) == at) {
      table_ = std::move(building_table_);
      ready_.store(true, std::memory_order_release);
    }
  }
  std::lock_guard<std::mutex> guard(build_mutex_);
  building_table_ = Table();
  building_ = false;
}

bool KeyDirectory::Lookup(uint64_t at, const std::vector<int64_t>& rowids, std::vector<std::optional<std::string>>* keys) const {
  std::shared_lock<std::shared_mutex> guard(mutex_);
  if (at % 2 != 0 || !ready_.load(std::memory_order_acquire) || generation_.load(std::memory_order_acquire) != at) return false;
  keys->clear();
  for (const int64_t rowid : rowids) {
    const uint64_t slot = rowid >= 0 && static_cast<uint64_t>(rowid) < table_.slots.size() ? table_.slots[static_cast<size_t>(rowid)] : 0;
    if (slot == 0) {
      keys->emplace_back(std::nullopt);
    } else {
      keys->emplace_back(std::string(table_.arena, slot >> 24, (slot & 0xFFFFFF) - 1));
    }
  }
  return true;
}

bool KeyDirectory::Length(uint64_t at, int64_t rowid, uint32_t* length) const {
  std::shared_lock<std::shared_mutex> guard(mutex_);
  if (at % 2 != 0 || !ready_.load(std::memory_order_acquire) || generation_.load(std::memory_order_acquire) != at) return false;
  if (rowid < 0 || static_cast<uint64_t>(rowid) >= table_.lengths.size()) return false;
  *length = table_.lengths[static_cast<size_t>(rowid)];
  return *length != Table::kUnknownLength;
}

}  // namespace elasticd
}  // namespace corvlumex
