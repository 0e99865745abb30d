// A line that is read is written as a line that reads the same; an import stores every line or,
// naming the first wrong one, none.
#include <sys/mman.h>
#include <unistd.h>

#include <cmath>
#include <limits>
#include <optional>

#include "ctl/output.h"
#include "ctl/tally_import.h"
#include "ctl/tally_lines.h"
#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "platform/linux/counters/counter_store.h"

namespace quorlet {
namespace {

constexpr std::int32_t kLastDay = std::numeric_limits<std::int32_t>::max();

// What an import must leave in the store.
struct Model {
  std::map<std::pair<std::string, std::int32_t>, std::int64_t> scalars;
  std::map<std::pair<std::string, std::int32_t>, std::size_t> values;  // how many
  std::size_t lines = 0;
  bool isWrong = false;
  bool isDroppable = true;  // the last day of all stays in the store
};

std::string Line(const std::variant<ScalarLine, SampleLine, std::string>& parsed) {
  std::string line;
  if (const auto* scalar = std::get_if<ScalarLine>(&parsed)) {
    AppendScalarLine(scalar->day, Escape(scalar->key), scalar->value, line);
  } else {
    const auto& sample = std::get<SampleLine>(parsed);
    AppendSampleLine(sample.day, Escape(sample.key), sample.sample, line);
  }
  return line;
}

void AddLine(std::string_view text, Model& model) {
  ++model.lines;
  const auto parsed = ParseTallyLine(text);
  if (const auto* why = std::get_if<std::string>(&parsed)) {
    model.isWrong = true;
    Expect(why->size() <= text.size() + 100, "a reason is too long", *why);
    return;
  }
  const std::string line = Line(parsed);
  const auto again = ParseTallyLine(std::string_view(line).substr(0, line.size() - 1));
  Expect(!std::holds_alternative<std::string>(again), "a written line is refused", line);
  Expect(Line(again) == line, "a line has changed", line);
  std::int32_t day = 0;
  if (const auto* scalar = std::get_if<ScalarLine>(&parsed)) {
    day = scalar->day;
    Expect(std::get<ScalarLine>(again).key == scalar->key, "a key has changed", line);
    model.scalars[{scalar->key, day}] = scalar->value;
  } else {
    const auto& sample = std::get<SampleLine>(parsed);
    const auto& other = std::get<SampleLine>(again);
    day = sample.day;
    Expect(other.key == sample.key && other.sample.secondsInDay == sample.sample.secondsInDay &&
               (other.sample.value == sample.sample.value || std::isnan(sample.sample.value)),
           "a value has changed", line);
    ++model.values[{sample.key, day}];
  }
  model.isDroppable &= day != kLastDay;
}

Model ModelOf(std::string_view text) {
  Model model;
  while (!text.empty() && !model.isWrong) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(text.size(), line.size() + 1));
    AddLine(line, model);
  }
  return model;
}

// The whole store.
void Compare(CounterStore& store, const Model& model) {
  Model stored;
  if (const auto history = store.initWithDefaultPath()) {
    const std::int32_t first = std::numeric_limits<std::int32_t>::min();
    history->scalarsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", first, kLastDay,
        [&](std::string_view key, std::int32_t day, std::int64_t value, bool&) {
          stored.scalars[{std::string(key), day}] = value;
        });
    history->distributionsForKeyPrefixMinDaysSince1970MaxDaysSince1970RowHandler(
        "", first, kLastDay,
        [&](std::string_view key, std::int32_t day, TLHistoryDistributionEnumerator& values,
            bool&) {
          double value = 0;
          std::int32_t second = 0;
          std::size_t& count = stored.values[{std::string(key), day}];
          while (values.getNextValueSecondsInDayOffset(value, second)) ++count;
        });
  }
  Expect(stored.scalars == model.scalars && stored.values == model.values,
         "the store holds something else");
}

void Import(std::string_view text, const Model& model) {
  static const TempRoot device;
  static FakePlatform platform;
  static const auto store =
      MakeLinuxCounterStore(device.root(), Access::kReadWrite, platform.clock, platform.queries,
                            platform.preferences, platform.log);
  const int file = memfd_create("lines", MFD_CLOEXEC);
  Expect(file >= 0 && ::write(file, text.data(), text.size()) == static_cast<ssize_t>(text.size()),
         "no memory file");
  const std::string name = "/proc/self/fd/" + std::to_string(file);
  const Messages messages;
  std::optional<std::string> failure;
  ImportCounts counts;
  try {
    counts = ImportTallies(name, *store, messages);
  } catch (const Failure& wrong) {
    failure = wrong.what();
  }
  ::close(file);
  Expect(failure.has_value() == model.isWrong, "an import ends otherwise", failure.value_or(""));
  if (failure) {
    const std::string place = name + ": line " + std::to_string(model.lines) + " ";
    Expect(failure->starts_with(place), "another line is named", *failure);
    Expect(failure->size() < 400, "a failure is too long", *failure);
  } else {
    Expect(counts.scalars + counts.values == model.lines, "lines are not counted");
  }
  Compare(*store, model.isWrong ? Model() : model);
  StoreChanges drop;
  drop.dropCounters = true;
  Expect(store->write(drop), "the store cannot be emptied");
}

}  // namespace
}  // namespace quorlet

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const std::string_view text = AsText(data, size);
  const Model model = ModelOf(text);
  if (model.isDroppable) Import(text, model);
  return 0;
}
