#include "ctl/record_book.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <map>
#include <string>
#include <vector>

#include "fakes/fake_clock.h"
#include "fakes/fake_counter_store.h"

namespace quorlet {
namespace {

constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
constexpr uid_t kSelf = 900;

class RecordBookTest : public testing::Test {
 protected:
  Refusal add(RecordBook& book, const std::string& text, Sender sender = kSelf) {
    StatsdLine line;
    const Refusal refusal = ParseStatsdLine(text, line);
    return refusal != Refusal::kNone ? refusal : book.add(line, sender, 5);
  }
  // Takes in lines separated by blanks.
  void addAll(RecordBook& book, std::string text) {
    std::ranges::replace(text, ' ', '\n');
    std::string_view rest = text;
    while (const auto line = NextStatsdLine(rest)) {
      EXPECT_EQ(add(book, std::string(*line)), Refusal::kNone) << *line;
    }
  }
  std::map<std::string, std::int64_t> stored(std::int32_t day) {
    std::map<std::string, std::int64_t> scalars;
    for (const auto& [row, value] : store.scalars) {
      if (row.second == day) scalars[row.first] = value;
    }
    return scalars;
  }
  bool write(RecordBook& book) { return store.write(book.take()); }

  FakeClock clock;
  FakeCounterStore store{clock};
};

TEST_F(RecordBookTest, SumsAcrossFlushesAndDays) {
  RecordBook book(RecordWhitelist::Naming(true), kSelf);
  ASSERT_TRUE(book.enterDay(7, store));
  addAll(book, "half:2.5|c down:-2.5|c rate:3|c|@0.1 most:9223372036854775806|c kept:5|c g:4|g");
  ASSERT_TRUE(write(book));
  // 2.5 was written as 3, so the next half adds nothing; and so on.
  addAll(book,
         "half:0.5|c down:0.1|c most:9:9|c kept:0|c g:-1.5|g new:+2|g exact:9007199254740993|c");
  ASSERT_TRUE(book.enterDay(8, store));
  addAll(book, "half:0.4|c g:10|g g:1:+2:-0.5|g");
  ASSERT_TRUE(write(book));
  EXPECT_TRUE(book.empty());
  using Scalars = std::map<std::string, std::int64_t>;
  EXPECT_EQ(stored(7), (Scalars{{"half", 3},
                                {"down", -2},
                                {"rate", 30},
                                {"most", kMost},
                                {"kept", 5},
                                {"g", 3},
                                {"new", 2},
                                {"exact", 9007199254740993}}));
  EXPECT_EQ(stored(8), (Scalars{{"half", 0}, {"g", 3}}));
}

TEST_F(RecordBookTest, KeysOfADayAreSharedAcrossListeners) {
  const RecordLimits limits{.keys = 5, .keysOfUser = 2, .values = 3};
  store.hasScalar("old", 7, 1);
  store.hasDistribution("old.values", 7, {1, 2});
  for (const char* owned : {"a1", "a2"}) {  // each in a listener of its own
    RecordBook book(RecordWhitelist::Naming(true), kSelf, limits);
    ASSERT_TRUE(book.enterDay(7, store));
    EXPECT_EQ(add(book, owned + std::string(":1|c"), 10), Refusal::kNone);
    ASSERT_TRUE(write(book));
  }
  RecordBook book(RecordWhitelist::Naming(true), kSelf, limits);
  ASSERT_TRUE(book.enterDay(7, store));
  EXPECT_EQ(add(book, "a3:1|c", 10), Refusal::kTooManyKeysOfUser);
  EXPECT_EQ(add(book, "old:1|c", 10), Refusal::kNone);
  EXPECT_EQ(add(book, "old.values:1:2|ms", 10), Refusal::kTooManyValues);
  EXPECT_EQ(add(book, "old.values:1|ms", 10), Refusal::kNone);
  EXPECT_EQ(add(book, "old.values:1|ms", 10), Refusal::kTooManyValues);
  EXPECT_EQ(add(book, "b1:1|c", std::nullopt), Refusal::kNone);
  EXPECT_EQ(add(book, "b2:1|c", 0), Refusal::kTooManyKeys);
  ASSERT_TRUE(book.enterDay(8, store));
  EXPECT_EQ(add(book, "a3:1|c", 10), Refusal::kNone);
}

TEST_F(RecordBookTest, ReservedKeysAreForRootAndTheService) {
  RecordBook book(RecordWhitelist::Naming(true), kSelf);
  ASSERT_TRUE(book.enterDay(7, store));
  for (const char* line : {"nuvex.a:1|c", "datausage.b:1|ms"}) {
    EXPECT_EQ(add(book, line, 10), Refusal::kReserved);
    EXPECT_EQ(add(book, line, std::nullopt), Refusal::kReserved);
    EXPECT_EQ(add(book, line, kSelf), Refusal::kNone);
    EXPECT_EQ(add(book, line, 0), Refusal::kNone);
  }
  EXPECT_EQ(add(book, "nuvexa:1|c", 10), Refusal::kNone);
}

}  // namespace
}  // namespace quorlet
