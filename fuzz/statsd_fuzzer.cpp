// A line that is read keeps to the protocol's bounds, reads the same when written anew, and costs
// the others nothing; whatever a datagram holds, what is to be written stays within the limits.
#include <cmath>
#include <set>

#include "ctl/record_book.h"
#include "fakes/fake_clock.h"
#include "fakes/fake_counter_store.h"
#include "fuzz_support.h"

namespace quorlet {
namespace {

constexpr std::int32_t kDay = 7;
constexpr std::int32_t kSecond = 5;
constexpr Sender kUser = 1000;
constexpr RecordLimits kLimits{.keys = 8, .keysOfUser = 5, .values = 20, .waitingValues = 50};

void CheckLine(std::string_view text, const StatsdLine& line) {
  Expect(!line.key.empty() && line.key.size() <= kLongestRecordedKey, "a key's length", text);
  for (const char letter : line.key) {
    const auto byte = static_cast<unsigned char>(letter);
    Expect(byte > 0x20 && byte != 0x7f && letter != ':' && letter != '|', "a key's byte", text);
  }
  Expect(text.starts_with(line.key), "a key from elsewhere", text);
  Expect(line.rate > 0 && line.rate <= 1, "a rate", text);
  Expect(!line.numbers.empty() && line.numbers.size() <= text.size() / 2, "how many", text);
  for (const StatsdNumber& number : line.numbers) {
    Expect(std::isfinite(number.real), "a number", text);
  }
}

// What was read must not depend on what follows the type, but for the rate.
void CheckAgain(std::string_view text, const StatsdLine& line) {
  const std::string longer = std::string(text) + "|#a:b,c|T17|c:x";
  StatsdLine again;
  Expect(ParseStatsdLine(longer, again) == Refusal::kNone, "further fields are refused", longer);
  Expect(again.key == line.key && again.kind == line.kind && again.rate == line.rate &&
             again.numbers.size() == line.numbers.size(),
         "further fields change a line", longer);
}

void CheckBatch(const StoreChanges& batch) {
  std::set<std::string> keys;
  for (const ScalarChange& change : batch.scalars) {
    keys.insert(change.key);
    Expect(change.day == kDay, "another day", change.key);
  }
  for (const RecordedValues& recorded : batch.values) {
    keys.insert(recorded.key);
    std::size_t count = 0;
    for (const RecordedValues::Run& run : recorded.runs) count += run.count;
    Expect(count == recorded.values.size() && count <= kLimits.values, "values", recorded.key);
  }
  Expect(keys.size() <= kLimits.keysOfUser, "too many keys");
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  static FakeClock clock;
  static FakeCounterStore store(clock);
  RecordBook book(RecordWhitelist::Naming(true), 900, kLimits);
  Expect(book.enterDay(kDay, store), "no day");
  RecordRefusals refusals;
  StatsdLine line;
  std::string_view rest = AsText(data, size);
  while (const auto text = NextStatsdLine(rest)) {
    Refusal refusal = ParseStatsdLine(*text, line);
    if (refusal == Refusal::kNone) {
      CheckLine(*text, line);
      CheckAgain(*text, line);
      refusal = book.add(line, kUser, kSecond);
    }
    if (refusal != Refusal::kNone) refusals.add(refusal, kUser);
  }
  if (const auto told = refusals.take()) Expect(told->size() < 1000, "a long line", *told);
  CheckBatch(book.take());
  return 0;
}
