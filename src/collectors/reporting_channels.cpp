#include "collectors/reporting_channels.h"

#include "drvreport/drvreport.h"
#include "platform/report_records.h"
#include "values/text.h"

namespace quorlet {
namespace {

int keepSimpleChannels(Dictionary& channel) {
  return DrvReportChannelGetFormat(channel) == kDrvReportFormatSimple ? 0 : kDrvReportLeaveOut;
}

int recordChannelSample(Dictionary& sample, CounterBatch& counters) {
  if (DrvReportChannelGetFormat(sample) != kDrvReportFormatSimple) return 0;
  const std::string* name = DrvReportChannelGetChannelName(sample);
  counters.TLClientSetValueForScalarKey(
      FormatText("nuvex.drvreport.%@", name != nullptr ? std::optional(*name) : std::nullopt),
      DrvReportSimpleGetIntegerValue(sample));
  return 0;
}

}  // namespace

void collectReportingChannelMetrics(DriverRegistry& registry, CounterBatch& counters) {
  auto channels = DrvReportCopyChannelsInCategories(registry, kDailyCategory, kDrvReportByDriver);
  if (!channels) return;
  DrvReportPrune(*channels, keepSimpleChannels);
  Dictionary subscribed;
  const auto subscription =
      DrvReportCreateSubscription(registry, nullptr, &*channels, &subscribed, 0);
  if (subscription == nullptr) return;
  const auto samples = DrvReportCreateSamples(subscription.get(), &subscribed);
  if (!samples) return;
  DrvReportIterate(
      *samples, [&counters](Dictionary& sample) { return recordChannelSample(sample, counters); });
}

}  // namespace quorlet
