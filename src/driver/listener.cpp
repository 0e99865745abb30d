#include "driver/listener.h"

#include <optional>
#include <string>

#include "values/digits.h"

namespace quorlet {
namespace {

constexpr char kLoggingNotification[] = "nuvex.aggregated.quorlet.logging";
constexpr double kSliceSeconds = 10.0;

enum Operation : std::int32_t {
  OperationLoggingStatus = 0,
  OperationRunDay = 1,
  OperationAppInfo = 2
};

// The field's 64 bits; 0 when it is missing or not an integer.
std::int64_t IntegerField(const Dictionary& message, std::string_view key) {
  const PropertyValue* value = message.find(key);
  const Number* number = value != nullptr ? value->asNumber() : nullptr;
  if (number == nullptr || number->isReal()) return 0;
  return number->kind() == NumberKind::kUInt64 ? static_cast<std::int64_t>(number->toUInt64())
                                               : number->toInt64();
}

}  // namespace

bool appInfoRecordFromMessage(const PropertyValue& element, Array& records) {
  const Dictionary* fields = element.asDictionary();
  if (fields == nullptr) return true;
  const Data* uuid = DataEntry(*fields, "uuid");
  const std::string* bundle = StringEntry(*fields, "bundle_id");
  const std::string* version = StringEntry(*fields, "version");
  if (uuid == nullptr || uuid->size() != kUuidBytes || bundle == nullptr || version == nullptr) {
    return true;
  }
  records.push_back(Dictionary{{"bundle", *bundle},
                               {"version", *version},
                               {"teskID", Int64(IntegerField(*fields, "tesk_id"))},
                               {"arch", Int64(IntegerField(*fields, "arch"))},
                               {"uuid", UuidText(std::span(*uuid).first<kUuidBytes>())}});
  return true;
}

void Listener::serve() {
  NamedService& service = platform_.namedService;
  // Without a listener no message can arrive; the quiet slice is waited out all the same.
  (void)service.ListenNamedService(
      kServiceName, [this](const ListenerEvent& event) { handleListenerEvent(event); });
  while (service.RunMainLoop(kSliceSeconds, true) != MainLoopResult::kTimedOut) {
  }
  if (!appInfoRequested_) return;
  platform_.log.log("never received requested AAI, so moving along without it");
  driver_.runDailyTasksIfNewDay(std::nullopt);
}

void Listener::handleListenerEvent(const ListenerEvent& event) {
  if (event.peer == nullptr) return;
  platform_.namedService.AcceptPeerConnection(
      *event.peer, [this](const PropertyValue& message) { handlePeerMessage(message); });
}

void Listener::handlePeerMessage(const PropertyValue& message) {
  const Dictionary* dictionary = message.asDictionary();
  if (dictionary == nullptr) return;
  const auto operation = static_cast<std::int32_t>(IntegerField(*dictionary, "operation"));
  if (operation == OperationAppInfo) {
    handleAppInfo(*dictionary);
  } else if (!statusHandled_.test_and_set()) {
    handleStatusOperation(operation, *dictionary);
  }
}

void Listener::handleAppInfo(const Dictionary& message) {
  Array records;
  if (const Array* elements = ArrayEntry(message, "app_data")) {
    for (const PropertyValue& element : *elements) {
      if (!appInfoRecordFromMessage(element, records)) break;
    }
  }
  platform_.log.log("quorlet got %sAAI:\n%@",
                    appInfoRequested_ ? "requested" : "(unsolicited -- so ignoring) ",
                    PropertyValue(records));
  if (!appInfoRequested_) return;
  driver_.runDailyTasksIfNewDay(records);
  appInfoRequested_ = false;
}

void Listener::handleStatusOperation(std::int32_t operation, const Dictionary& message) {
  if (operation == OperationRunDay) {
    driver_.runDailyTasks(static_cast<std::int32_t>(IntegerField(message, "value")), std::nullopt);
  } else if (operation == OperationLoggingStatus) {
    appInfoRequested_ = true;
    platform_.notifications.PostNotification(kLoggingNotification);
    platform_.log.log("notified of logging status, waiting for activate app info");
  }
}

}  // namespace quorlet
