// Any tasking beside any stored state: a run that dies at any change of the preferences, and is
// repeated, ends as one that does not die; a second run changes nothing.
#include "driver/tasking.h"
#include "fakes/fake_platform.h"
#include "fuzz_support.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr char kOwnDomain[] = "nuvex.aggregated.quorlet";
constexpr char kScheduledDomain[] = "nuvex.Ferryman";
constexpr int kMostRuns = 8;

struct Died {};

using Disk = FakePreferences::Disk;

// One process; whether it came to its end. It dies at the change with the number `diesAt`.
bool Run(const std::shared_ptr<Disk>& disk, int diesAt, std::vector<std::string>& posted) {
  FakePlatform platform;
  FakePreferences preferences(disk, &platform.log);
  Platform services = platform.services.with({.preferences = &preferences});
  int changes = 0;
  if (diesAt >= 0) {
    preferences.beforeChange = [&] {
      if (changes++ == diesAt) throw Died();
    };
  }
  bool isFinished = true;
  try {
    updateTasking(services);
  } catch (const Died&) {
    preferences.crash();
    isFinished = false;
  }
  posted.insert(posted.end(), platform.notifications.posted.begin(),
                platform.notifications.posted.end());
  return isFinished;
}

std::shared_ptr<Disk> MakeDisk(const Dictionary& input) {
  auto disk = std::make_shared<Disk>();
  if (const auto* scheduled = input.find("Scheduled")) {
    (*disk)[kScheduledDomain].insert_or_assign("ScheduledTasking", *scheduled);
  }
  if (const Dictionary* own = DictionaryEntry(input, "Own")) {
    for (const auto& [key, value] : *own) (*disk)[kOwnDomain].insert_or_assign(key, value);
  }
  return disk;
}

// The texts, since NaN equals nothing; domains without keys do not count.
std::string Text(const Disk& disk) {
  std::string text;
  for (const auto& [domain, entries] : disk) {
    for (const auto& [key, value] : entries) {
      text += domain + "\t" + key + "\t" + value.description() + "\n";
    }
  }
  return text;
}

// A tasking may write to what decides about tasking: then there is no telling how it ends.
bool ChangesTasking(const Array* payload) {
  if (payload == nullptr) return false;
  for (const PropertyValue& element : *payload) {
    const Dictionary* entry = element.asDictionary();
    const std::string* domain = entry != nullptr ? StringEntry(*entry, "Domain") : nullptr;
    if (domain != nullptr && (*domain == kOwnDomain || *domain == kScheduledDomain)) return true;
  }
  return false;
}

bool ChangesTasking(const PropertyValue* tasking) {
  const Dictionary* entries = tasking != nullptr ? tasking->asDictionary() : nullptr;
  return entries != nullptr && ChangesTasking(ArrayEntry(*entries, "TaskingPayload"));
}

bool ChangesTasking(const Dictionary& input) {
  const Dictionary* own = DictionaryEntry(input, "Own");
  return ChangesTasking(input.find("Scheduled")) ||
         (own != nullptr && (ChangesTasking(ArrayEntry(*own, "TaskingPayload")) ||
                             ChangesTasking(own->find("TaskingInProgress"))));
}

}  // namespace
}  // namespace quorlet

// {Scheduled, Own}; DiesAt is the change at which the first run dies.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quorlet;
  const auto document = ReadPropertyList(AsText(data, size));
  const auto* value = std::get_if<PropertyValue>(&document);
  const Dictionary* input = value != nullptr ? value->asDictionary() : nullptr;
  if (input == nullptr) return 0;
  std::vector<std::string> posted;
  const auto disk = MakeDisk(*input);
  Expect(Run(disk, -1, posted), "a run without cause to die dies");
  if (ChangesTasking(*input)) return 0;
  const std::string settled = Text(*disk);
  std::vector<std::string> postedAgain;
  Run(disk, -1, postedAgain);
  Expect(Text(*disk) == settled, "a second run changes something", settled);

  const auto other = MakeDisk(*input);
  std::vector<std::string> postedByOther;
  int diesAt = static_cast<int>(IntegerEntry(*input, "DiesAt").value_or(0) & 31);
  for (int run = 0; run < kMostRuns && !Run(other, diesAt, postedByOther); ++run) ++diesAt;
  Run(other, -1, postedByOther);
  Expect(Text(*other) == settled, "a run that died ends otherwise",
         settled + "---\n" + Text(*other));
  Expect(posted.empty() || !postedByOther.empty(), "a change is not announced");
  return 0;
}
