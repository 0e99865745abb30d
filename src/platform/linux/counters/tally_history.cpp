#include "platform/linux/counters/tally_history.h"

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/counters/tally_blocks.h"

namespace quorlet {
namespace {

// The rows that an enumeration asks for.
class Selection {
 public:
  Selection(std::string_view prefix, std::int32_t minDay, std::int32_t maxDay)
      : firstDay_(std::int64_t{minDay} + 1), lastDay_(maxDay), low_(prefix), high_(prefix) {
    // The first key after all that start with the prefix; none when it is all 0xff bytes.
    while (!high_.empty() && high_.back() == '\xff') high_.pop_back();
    if (!high_.empty()) high_.back() = static_cast<char>(high_.back() + 1);
  }
  bool isEmpty() const { return firstDay_ > lastDay_; }
  // A query for one day runs along the primary key: there is nothing to sort.
  std::string query(const std::string& column, const std::string& table) const {
    const char* days = firstDay_ == lastDay_ ? "day = ?1 AND ?1 = ?2" : "day BETWEEN ?1 AND ?2";
    return "SELECT key, day, " + column + " FROM " + table + " WHERE " + days + " AND key >= ?3" +
           (high_.empty() ? " AND ?4 = x''" : " AND key < ?4") + " ORDER BY key, day";
  }
  SqliteRun run(const SqliteDatabase& database, SqliteStatement& statement) const {
    return {
        database, statement, firstDay_, lastDay_, std::string_view(low_), std::string_view(high_)};
  }

 private:
  std::int64_t firstDay_;
  std::int64_t lastDay_;
  std::string low_;
  std::string high_;
};

// The values of one sequence, a block at a time.
class BlockEnumerator : public TLHistoryDistributionEnumerator {
 public:
  // `samples` is working memory, kept from row to row.
  BlockEnumerator(const SqliteDatabase& database, SqliteStatement& statement, std::int64_t sequence,
                  std::vector<DistributionSample>& samples)
      : run_(database, statement, sequence * kBlocksPerSequence,
             (sequence + 1) * kBlocksPerSequence - 1),
        samples_(samples) {}

  // SQLITE_OK, or what ended the values early.
  int failure() const { return failure_; }
  bool failed() const override { return failure_ != SQLITE_OK; }

 protected:
  std::span<const DistributionSample> nextBlock() override {
    if (ended_) return {};
    const int code = run_.next();
    if (code == SQLITE_ROW && UnpackBlock(run_.bytes(0), before_, samples_)) {
      before_ += samples_.size();
      return samples_;
    }
    ended_ = true;
    if (code == SQLITE_ROW) failure_ = SQLITE_CORRUPT;
    if (code != SQLITE_ROW && code != SQLITE_DONE) failure_ = code;
    return {};
  }

 private:
  SqliteRun run_;
  std::vector<DistributionSample>& samples_;
  std::uint64_t before_ = 0;
  bool ended_ = false;
  int failure_ = SQLITE_OK;
};

class TallyHistory : public TLHistory {
 public:
  TallyHistory(TallyDatabase database, TallyReadFailure onFailure)
      : database_(std::move(database)),
        onFailure_(std::move(onFailure)),
        failed_(!database_.isOpen()) {}

  bool failed() const override { return failed_; }

  void scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      std::string_view keyPrefix, std::int32_t minDay, std::int32_t maxDay,
      const ScalarHandler& rowHandler) override {
    enumerate(Selection(keyPrefix, minDay, maxDay), "value", "scalars",
              [&](std::string_view key, std::int32_t day, std::int64_t value, bool& stop) {
                rowHandler(key, day, value, stop);
                return SQLITE_OK;
              });
  }

  void distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
      std::string_view keyPrefix, std::int32_t minDay, std::int32_t maxDay,
      const DistributionHandler& rowHandler) override {
    SqliteStatement blocks("SELECT samples FROM blocks WHERE id BETWEEN ?1 AND ?2 ORDER BY id");
    std::vector<DistributionSample> samples;
    enumerate(Selection(keyPrefix, minDay, maxDay), "id", "sequences",
              [&](std::string_view key, std::int32_t day, std::int64_t sequence, bool& stop) {
                if (sequence < 0 || sequence > kLastSequence) return SQLITE_CORRUPT;
                BlockEnumerator values(database_.connection(), blocks, sequence, samples);
                rowHandler(key, day, values, stop);
                return values.failure();
              });
  }

 private:
  // Calls `handler(key, day, number, stop)` for each row; it returns SQLITE_OK or the error that
  // ends the enumeration.
  template <typename Handler>
  void enumerate(const Selection& selection, const char* column, const char* table,
                 const Handler& handler) {
    if (!database_.isOpen() || selection.isEmpty()) return;
    const int code = visitRows(selection, column, table, handler);
    if (code == SQLITE_OK) return;
    failed_ = true;
    onFailure_(database_, code);
  }

  template <typename Handler>
  int visitRows(const Selection& selection, const char* column, const char* table,
                const Handler& handler) {
    const std::string query = selection.query(column, table);
    SqliteStatement statement(query.c_str());
    SqliteRun rows = selection.run(database_.connection(), statement);
    int code = SQLITE_OK;
    bool stop = false;
    while (!stop && code == SQLITE_OK) {
      code = rows.next();
      if (code == SQLITE_DONE) return SQLITE_OK;
      if (code != SQLITE_ROW) return code;
      // The query's range makes the day fit.
      const auto day = static_cast<std::int32_t>(rows.integer(1));
      code = handler(rows.bytes(0), day, rows.integer(2), stop);
    }
    return code;
  }

  TallyDatabase database_;
  TallyReadFailure onFailure_;
  bool failed_;
};

}  // namespace

std::unique_ptr<TLHistory> MakeTallyHistory(TallyDatabase database, TallyReadFailure onFailure) {
  return std::make_unique<TallyHistory>(std::move(database), std::move(onFailure));
}

}  // namespace quorlet
