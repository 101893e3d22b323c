#include "programs/corvelasticd/search_candidates.h"

#include <algorithm>
#include <cstdint>
#include <unordered_map>

#include "programs/corvelasticd/rank_function.h"

namespace corvlumex {
namespace elasticd {
namespace {

SqlValue ColumnValue(const Statement& stmt, int column) {
  switch (stmt.Type(column)) {
    case SQLITE_INTEGER: return stmt.Int(column);
    case SQLITE_FLOAT: return stmt.Real(column);
    case SQLITE_NULL: return nullptr;
    default: return stmt.Text(column);
  }
}

}  // namespace

bool StatementCandidates::Next(int64_t* rowid, Hit* hit) {
  if (done_) return false;
  if (!select_->Step()) {
    done_ = true;
    return false;
  }
  *rowid = select_->Int(0);
  hit->key = select_->Text(1);
  hit->score = ranked_ ? -select_->Real(2) + (tiers_ != nullptr ? tiers_->Bonus(*rowid) : 0.0) : 0.0;
  hit->sort_value = ColumnValue(*select_, 3);
  return true;
}

constexpr size_t kKeyWindow = 64;  // rows whose keys one statement reads

std::string KeysOfRowsSql() {
  std::string sql = "SELECT rowid, key FROM docs WHERE rowid IN (?";
  for (size_t i = 1; i < kKeyWindow; ++i) sql += ", ?";
  return sql + ")";
}

RankedMatchCandidates::RankedMatchCandidates(Database& reader, const std::string& match,
                                             const std::string& rank_expression, const NameTiers& tiers,
                                             int recency_code, const KeyDirectory* keys, uint64_t keys_at)
    : keys_of_rows_(reader.Cached(KeysOfRowsSql())), reader_(reader), recency_code_(recency_code), keys_(keys),
      keys_at_(keys_at) {
  Statement& matches = reader.Cached("SELECT rowid, " + rank_expression + " FROM fts_text WHERE fts_text MATCH ?1");
  matches.BindText(1, match);
  // The scores take the lengths of rows from the directory (rank_function.h).
  RowLengths lengths{keys_, keys_at_};
  matches.BindPointer(kLengthsParameter, &lengths, kRowLengthsType);
  while (matches.Step()) {
    const int64_t rowid = matches.Int(0);
    ranked_.emplace_back(matches.Real(1) - tiers.Bonus(rowid), rowid);
  }
  matches.Reset();
  // A commit begun before the snapshot was taken: the directory may be ahead of it.
  if (keys_ != nullptr && keys_->generation() != keys_at_) keys_ = nullptr;
  // Equal scores keep no order of their own here: runs of them are put in key order below.
  std::sort(ranked_.begin(), ranked_.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
}

bool RankedMatchCandidates::LoadNextWindow() {
  window_.clear();
  window_next_ = 0;
  while (window_.empty() && next_ < ranked_.size()) {
    // A window ends with a run of equal scores, so that each run is ordered whole.
    size_t end = std::min(next_ + kKeyWindow, ranked_.size());
    while (end < ranked_.size() && ranked_[end].first == ranked_[end - 1].first) ++end;
    std::unordered_map<int64_t, size_t> slot;
    for (size_t i = next_; i < end; ++i) {
      slot.emplace(ranked_[i].second, window_.size());
      window_.push_back(Candidate{ranked_[i].first, ranked_[i].second, std::string(), false});
    }
    std::vector<int64_t> rowids;
    std::vector<std::optional<std::string>> known;
    for (size_t i = next_; i < end; ++i) rowids.push_back(ranked_[i].second);
    if (keys_ != nullptr && keys_->Lookup(keys_at_, rowids, &known)) {
      for (size_t i = 0; i < known.size(); ++i) {
        if (!known[i]) continue;
        window_[i].key = std::move(*known[i]);
        window_[i].found = true;
      }
    } else {
      keys_ = nullptr;  // a commit came: from here on, from the snapshot itself
    }
    for (size_t start = next_; keys_ == nullptr && start < end; start += kKeyWindow) {
      keys_of_rows_.Reset();
      int bind = 1;
      for (size_t i = start; i < end && i < start + kKeyWindow; ++i) keys_of_rows_.Bind(bind++, ranked_[i].second);
      while (keys_of_rows_.Step()) {
        Candidate& candidate = window_[slot.at(keys_of_rows_.Int(0))];
        candidate.key = keys_of_rows_.Text(1);
        candidate.found = true;
      }
    }
    keys_of_rows_.Reset();
    next_ = end;
    // A match without its document (never the case in a consistent index) is left out, as a join would.
    window_.erase(std::remove_if(window_.begin(), window_.end(), [](const Candidate& c) { return !c.found; }), window_.end());
  }
  for (size_t run = 0; run < window_.size();) {
    size_t run_end = run + 1;
    while (run_end < window_.size() && window_[run_end].rank == window_[run].rank) ++run_end;
    // The window is loaded when the last one has been served whole.
    if (run_end - run > 1 && RunNeedsOrder(served_ + run, served_ + run_end)) OrderRun(run, run_end);
    run = run_end;
  }
  return !window_.empty();
}

void RankedMatchCandidates::CountOnly(size_t count) {
  count_only_ = true;
  cut_ = count > SIZE_MAX - served_ ? SIZE_MAX : served_ + count;
}

bool RankedMatchCandidates::RunNeedsOrder(size_t begin, size_t end) const {
  // Before the cut every member is counted whatever its place, past it none
  // is; only a run the cut divides decides which members are counted.
  return !count_only_ || (begin < cut_ && cut_ < end);
}

void RankedMatchCandidates::OrderRun(size_t begin, size_t end) {
  if (recency_code_ >= 0) {
    std::unordered_map<int64_t, size_t> slot;
    for (size_t i = begin; i < end; ++i) slot.emplace(window_[i].rowid, i);
    Statement& dates = reader_.Cached("SELECT rowid, corv_field(key, doc, ?) FROM docs WHERE rowid = ?");
    for (size_t i = begin; i < end; ++i) {
      dates.Reset();
      dates.Bind(1, static_cast<int64_t>(recency_code_));
      dates.Bind(2, window_[i].rowid);
      if (dates.Step()) window_[i].recency = ColumnValue(dates, 1);
    }
    dates.Reset();
  }
  // Newest first (a file without the date last), then byte order of the
  // keys, as SQLite compares text.
  const auto date = [](const SqlValue& value) {
    if (std::holds_alternative<int64_t>(value)) return static_cast<double>(std::get<int64_t>(value));
    if (std::holds_alternative<double>(value)) return std::get<double>(value);
    return -1e300;
  };
  std::sort(window_.begin() + static_cast<std::ptrdiff_t>(begin), window_.begin() + static_cast<std::ptrdiff_t>(end),
            [&](const Candidate& a, const Candidate& b) {
              const double x = date(a.recency), y = date(b.recency);
              if (x != y) return x > y;
              return a.key < b.key;
            });
}

bool RankedMatchCandidates::Next(int64_t* rowid, Hit* hit) {
  if (window_next_ >= window_.size() && !LoadNextWindow()) return false;
  Candidate& candidate = window_[window_next_++];
  ++served_;
  *rowid = candidate.rowid;
  hit->key = std::move(candidate.key);
  hit->score = -candidate.rank;  // the tier bonus is part of it
  hit->sort_value = nullptr;
  return true;
}

}  // namespace elasticd
}  // namespace corvlumex
