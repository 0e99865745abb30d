// Samples the channels of a root twice and shows the first difference.
#include <drvreport/drvreport.h>
#include <drvreport/machine_registry.h>

#include <iostream>

int main(int argc, char** argv) {
  using namespace quorlet;
  const auto registry = MakeMachineDriverRegistry(argc > 1 ? argv[1] : "/");
  const auto channels = DrvReportCopyAllChannels(*registry, kDrvReportByDriver);
  Dictionary subscribed;
  std::optional<ErrorValue> error;
  const auto subscription =
      DrvReportCreateSubscription(*registry, nullptr, &*channels, &subscribed, 0, &error);
  if (subscription == nullptr) {
    std::cerr << error->reason << '\n';
    return 1;
  }
  const auto before = DrvReportCreateSamples(subscription.get(), &subscribed);
  const auto after = DrvReportCreateSamples(subscription.get(), &subscribed);
  if (!before || !after) return 1;
  const auto growth = DrvReportCreateSamplesDelta(*before, *after);
  if (!growth) return 1;
  std::cout << DrvReportGetChannelCount(*growth) << " channels\n";
  return DrvReportIterate(*growth, [](Dictionary& sample) {
    std::cout << DrvReportSampleCopyDescription(sample).value_or("(no description)\n");
    return 0;
  });
}
