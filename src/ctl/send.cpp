// quorletctl send: messages to quorlet's named service.
#include <sys/socket.h>
#include <sys/time.h>

#include <CLI/CLI.hpp>
#include <chrono>
#include <cmath>
#include <memory>
#include <thread>

#include "ctl/json_value.h"
#include "ctl/options.h"
#include "ctl/session.h"
#include "platform/linux/base/paths.h"
#include "platform/linux/service/frame_buffer.h"
#include "platform/linux/service/services.h"
#include "platform/linux/service/unix_socket.h"
#include "platform/names.h"
#include "values/digits.h"
#include "values/property_list.h"

namespace quorlet {
namespace {

constexpr double kLongestWait = 86400;
constexpr char kWaitHelp[] = "Seconds to wait for the service to appear (default: 0)";
constexpr char kDayHelp[] = "Day number, YYYY-MM-DD, \"today\" or \"yesterday\"";

struct SendArguments {
  std::int32_t day = 0;
  std::string file;
  double waitSeconds = 0;
};
using Arguments = std::shared_ptr<SendArguments>;

// A connection to the service, which may take its time to appear.
Descriptor Connect(double waitSeconds) {
  using Clock = std::chrono::steady_clock;
  const auto deadline = Clock::now() + std::chrono::duration<double>(waitSeconds);
  const std::string directory = Root::FromEnvironment().path(kServiceDirectory);
  while (true) {
    const UnixSocketAddress address(directory, kServiceName);
    Descriptor connection = MakeUnixSocket();
    if (!connection.isOpen()) throw Failure("cannot make a socket: " + ErrnoText(errno));
    // A service that is stuck must not keep a script for ever.
    const timeval limit{.tv_sec = 60, .tv_usec = 0};
    setsockopt(connection.get(), SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit);
    const int error = address.connect(connection.get());
    if (error == 0) return connection;
    const bool mayAppear = error == ENOENT || error == ECONNREFUSED;
    if (!mayAppear || Clock::now() >= deadline) {
      throw Failure(std::string("cannot reach ") + kServiceName + ": " +
                    (mayAppear ? "the service is not running" : ErrnoText(error)));
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }
}

void Send(const Dictionary& message, double waitSeconds) {
  const auto document = WriteXmlPropertyList(message);
  const auto* text = std::get_if<std::string>(&document);
  if (text == nullptr || text->size() > kMaxFrameBytes) throw Failure("the message is too large");
  const Descriptor connection = Connect(waitSeconds);
  if (const int error = WriteFully(connection.get(), MakeFrame(*text))) {
    throw Failure(std::string("cannot send to ") + kServiceName + ": " + ErrnoText(error));
  }
}

// The bytes of "1B4E28BA-2FA1-11D2-883F-B9A761BDE3FB"; hyphens may be left out.
std::optional<Data> ParseUuid(std::string_view text) {
  std::string digits(text);
  const bool hyphenated = digits.size() == 36 && digits[8] == '-' && digits[13] == '-' &&
                          digits[18] == '-' && digits[23] == '-';
  if (hyphenated) std::erase(digits, '-');
  if (digits.size() != 2 * kUuidBytes) return std::nullopt;
  Data uuid;
  for (std::size_t i = 0; i < digits.size(); i += 2) {
    const auto byte = ParseNumber<std::uint8_t>(std::string_view(digits).substr(i, 2), 16);
    if (!byte) return std::nullopt;
    uuid.push_back(std::byte{*byte});
  }
  return uuid;
}

// The "app_data" element of one record; throws what is wrong with it.
Dictionary AppDataElement(const PropertyValue& record, std::size_t index) {
  const auto wrong = [index](const std::string& what) {
    return Failure("record " + std::to_string(index + 1) + ": " + what);
  };
  const Dictionary* fields = record.asDictionary();
  if (fields == nullptr) throw wrong("not an object");
  const std::string* uuidText = StringEntry(*fields, "uuid");
  const auto uuid = uuidText != nullptr ? ParseUuid(*uuidText) : std::nullopt;
  if (!uuid) throw wrong("\"uuid\" must be the text of a UUID");
  Dictionary element{{"uuid", *uuid}};
  // As in a message, or else as in the log.
  const auto find = [fields](const char* key, const char* nameInLog) {
    const PropertyValue* value = fields->find(key);
    return value != nullptr ? value : fields->find(nameInLog);
  };
  for (const auto& [key, nameInLog] : {std::pair("bundle_id", "bundle"), {"version", "version"}}) {
    const PropertyValue* value = find(key, nameInLog);
    const std::string* text = value != nullptr ? value->asString() : nullptr;
    if (text == nullptr) throw wrong(std::string("\"") + key + "\" must be a string");
    element[key] = *text;
  }
  for (const auto& [key, nameInLog] : {std::pair("tesk_id", "teskID"), {"arch", "arch"}}) {
    const PropertyValue* value = find(key, nameInLog);
    if (value == nullptr) continue;  // the service takes 0
    const Number* number = value->asNumber();
    if (number == nullptr || number->kind() != NumberKind::kInt64) {
      throw wrong(std::string("\"") + key + "\" must be an integer");
    }
    element[key] = *value;
  }
  return element;
}

Array ReadAppData(const std::string& file) {
  const auto bytes = ReadWholeFile(file, kMaxFrameBytes);
  if (const int* error = std::get_if<int>(&bytes)) {
    throw Failure("cannot read " + file + ": " + ErrnoText(*error));
  }
  const auto parsed = ParseJson(std::get<std::string>(bytes), JsonForm::kPlain);
  if (const auto* why = std::get_if<std::string>(&parsed)) {
    throw Failure(file + " is not JSON: " + *why);
  }
  const Array* records = std::get<PropertyValue>(parsed).asArray();
  if (records == nullptr) throw Failure(file + " holds no array of records");
  Array elements;
  for (std::size_t i = 0; i < records->size(); ++i) {
    elements.push_back(AppDataElement((*records)[i], i));
  }
  return elements;
}

void SendLoggingStatus(const SendArguments& arguments) {
  Send({{"operation", Int64(0)}}, arguments.waitSeconds);
}

void SendRunDay(const SendArguments& arguments) {
  Send({{"operation", Int64(1)}, {"value", Int64(arguments.day)}}, arguments.waitSeconds);
}

void SendAppInfo(const SendArguments& arguments) {
  Send({{"operation", Int64(2)}, {"app_data", ReadAppData(arguments.file)}}, arguments.waitSeconds);
}

}  // namespace

void AddSendCommands(CLI::App& app, Session& session) {
  CLI::App* send = AddFamily(app, "send", "Send a message to the running quorlet",
                             "quorletctl send logging-status --wait 5");
  const auto arguments = std::make_shared<SendArguments>();
  const auto add = [&](const char* name, const char* description, const char* notes,
                       const char* example, void (*run)(const SendArguments&)) {
    CLI::App* command = AddCommand(*send, name, description, notes, example);
    command->add_option("--wait", arguments->waitSeconds, kWaitHelp)
        ->check(CLI::Range(0.0, kLongestWait))
        ->check([](const std::string& text) {
          return ParseNumber<double>(text).value_or(NAN) >= 0 ? "" : "not a number of seconds";
        });
    command->callback(
        [&session, arguments, run] { session.command = [arguments, run] { run(*arguments); }; });
    return command;
  };

  add("logging-status", "Announce that app info is coming", "", "quorletctl send logging-status",
      SendLoggingStatus);
  const auto parseDay = [arguments](const std::string& text) {
    arguments->day = ParseDay("DAY", text);
  };
  add("run-day", "Run the daily pass for a day, whatever the gate says", "",
      "quorletctl send run-day 20000", SendRunDay)
      ->add_option_function<std::string>("DAY", parseDay, kDayHelp)
      ->required();
  add("app-info", "Send the activated applications",
      "FILE is a JSON array of objects with \"uuid\", \"bundle_id\", \"version\" (strings) and\n"
      "\"tesk_id\", \"arch\" (integers, 0 when left out). The names that the log has for them,\n"
      "\"bundle\" and \"teskID\", will do as well.",
      "quorletctl send app-info apps.json", SendAppInfo)
      ->add_option("FILE", arguments->file, "The records")
      ->required();
}

}  // namespace quorlet
