// Value trees to XML documents, in time linear in the document.
#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <map>
#include <system_error>
#include <utility>

#include "values/base64.h"
#include "values/property_list.h"
#include "values/property_list_errors.h"
#include "values/property_list_scalars.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";  // U+FFFD
constexpr double kFirstWrittenSecond = -62135596800;       // 0001-01-01T00:00:00Z
constexpr double kLastWrittenSecond = 253402300799;        // 9999-12-31T23:59:59Z
constexpr std::size_t kDataLineDigits = 76;

bool IsPlain(std::string_view text) { return PrintableAsciiPrefix(text) == text.size(); }

class XmlWriter {
 public:
  explicit XmlWriter(const PropertyListLimits& limits) : limits_(limits) {}

  std::variant<std::string, PropertyListError> write(const PropertyValue& root) {
    out_ = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
    if (!writeValue(root)) return PropertyListError{error_};
    out_ += "</plist>\n";
    if (out_.size() > limits_.bytes) return PropertyListError{TooLarge(limits_)};
    return std::move(out_);
  }

 private:
  bool fail(std::string error) {
    error_ = std::move(error);
    return false;
  }

  bool writeValue(const PropertyValue& value) {
    if (++values_ > limits_.values) return fail(TooManyValues(limits_));
    if (out_.size() > limits_.bytes) return fail(TooLarge(limits_));
    if (const Array* array = value.asArray()) return writeArray(*array);
    if (const Dictionary* dictionary = value.asDictionary()) return writeDictionary(*dictionary);
    if (const Data* data = value.asData()) return writeData(*data);
    if (const std::string* text = value.asString()) return writeText("string", AsWritten(*text));
    indent();
    if (const bool* boolean = value.asBoolean()) {
      out_ += *boolean ? "<true/>\n" : "<false/>\n";
    } else if (const Number* number = value.asNumber()) {
      writeNumber(*number);
    } else {
      out_.append("<date>").append(Rfc3339(AsWritten(*value.asDate()))).append("</date>\n");
    }
    return true;
  }

  void indent() { out_.append(depth_, '\t'); }

  void writeNumber(const Number& number) {
    if (number.isReal()) {
      const double real = number.toDouble();
      if (std::isinf(real)) {
        out_ += real > 0 ? "<real>+infinity</real>\n" : "<real>-infinity</real>\n";
      } else {
        writeDigits("real", real);
      }
    } else if (number.kind() == NumberKind::kUInt64) {
      writeDigits("integer", number.toUInt64());
    } else {
      writeDigits("integer", number.toInt64());
    }
  }

  // Reals with as few digits as give the same real again.
  template <typename T>
  void writeDigits(std::string_view element, T number) {
    std::array<char, 32> digits;
    const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr;
    out_.append("<").append(element).append(">").append(digits.data(), end);
    out_.append("</").append(element).append(">\n");
  }

  bool writeText(std::string_view element, std::string_view text) {
    // Refused before it is copied, six bytes for each of its own.
    if (text.size() > limits_.bytes) return fail(TooLarge(limits_));
    indent();
    out_.append("<").append(element).append(">");
    while (true) {
      const std::size_t plain = std::min(text.find_first_of("&<>\r"), text.size());
      out_ += text.substr(0, plain);
      if (plain == text.size()) break;
      const char special = text[plain];
      // Readers take a bare carriage return for a line break.
      out_ += special == '&'   ? "&amp;"
              : special == '<' ? "&lt;"
              : special == '>' ? "&gt;"
                               : "&#13;";
      text.remove_prefix(plain + 1);
    }
    out_.append("</").append(element).append(">\n");
    return true;
  }

  bool writeData(const Data& data) {
    if (data.size() > limits_.bytes) return fail(TooLarge(limits_));
    indent();
    out_ += "<data>\n";
    const std::string digits = Base64Text(data);
    for (std::size_t at = 0; at < digits.size(); at += kDataLineDigits) {
      indent();
      out_.append(digits, at, kDataLineDigits).append("\n");
    }
    indent();
    out_ += "</data>\n";
    return true;
  }

  bool writeArray(const Array& array) {
    return writeContainer("array", array.empty(), [&] {
      return std::all_of(array.begin(), array.end(),
                         [&](const PropertyValue& element) { return writeValue(element); });
    });
  }

  bool writeDictionary(const Dictionary& dictionary) {
    return writeContainer("dict", dictionary.empty(), [&] {
      const auto isPlain = [](const auto& entry) { return IsPlain(entry.first); };
      return std::all_of(dictionary.begin(), dictionary.end(), isPlain) ? writeEntries(dictionary)
                                                                        : writeRepaired(dictionary);
    });
  }

  template <typename Contents>
  bool writeContainer(std::string_view element, bool isEmpty, const Contents& writeContents) {
    // A tree that holds itself ends here too.
    if (depth_ == kMaxPropertyListDepth) {
      return fail(FormatText("the tree is %s", TooDeeplyNested()));
    }
    indent();
    out_.append("<").append(element).append(isEmpty ? "/>\n" : ">\n");
    if (isEmpty) return true;
    ++depth_;
    if (!writeContents()) return false;
    --depth_;
    indent();
    out_.append("</").append(element).append(">\n");
    return true;
  }

  bool writeEntries(const Dictionary& dictionary) {
    for (const auto& [key, value] : dictionary) {
      if (!writeText("key", key) || !writeValue(value)) return false;
    }
    return true;
  }

  // Of keys that repair makes the same, the last one's value stays.
  bool writeRepaired(const Dictionary& dictionary) {
    std::map<std::string, const PropertyValue*> entries;
    for (const auto& [key, value] : dictionary) entries.insert_or_assign(AsWritten(key), &value);
    for (const auto& [key, value] : entries) {
      if (!writeText("key", key) || !writeValue(*value)) return false;
    }
    return true;
  }

  const PropertyListLimits limits_;
  std::string out_;
  std::size_t depth_ = 0;
  std::size_t values_ = 0;
  std::string error_;
};

}  // namespace

std::string AsWritten(std::string_view text) {
  if (IsPlain(text)) return std::string(text);
  const std::string repaired = RepairUtf8(text);
  std::string_view rest = repaired;
  std::string out;
  while (true) {
    const std::size_t good = XmlTextPrefix(rest);
    out += rest.substr(0, good);
    rest.remove_prefix(good);
    if (rest.empty()) return out;
    out += kReplacement;
    // A control character, or U+FFFE or U+FFFF in three bytes.
    rest.remove_prefix(static_cast<unsigned char>(rest[0]) < 0x20 ? 1 : 3);
  }
}

Date AsWritten(Date date) {
  if (std::isnan(date.secondsSince1970)) return {0};
  return {std::clamp(std::floor(date.secondsSince1970), kFirstWrittenSecond, kLastWrittenSecond)};
}

std::variant<std::string, PropertyListError> WriteXmlPropertyList(
    const PropertyValue& root, const PropertyListLimits& limits) {
  return XmlWriter(limits).write(root);
}

}  // namespace quorlet
