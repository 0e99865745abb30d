// A strict reader of the few elements that the format has:
//   [BOM] [<?xml …?>] [document type] <plist> value </plist>
// with comments, processing instructions and blanks between elements.
#include "values/property_list_xml.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <iterator>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "values/property_list_errors.h"
#include "values/property_list_scalars.h"
#include "values/text.h"

namespace quorlet {
namespace {

bool IsLetter(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); }
bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }
bool IsNameCharacter(char c) {
  return IsLetter(c) || (c >= '0' && c <= '9') || c == '_' || c == '-' || c == '.' || c == ':';
}

enum class Role : std::uint8_t { kRoot, kDictionary, kArray, kKey, kText, kFlag, kScalar };

struct Element {
  std::string_view name;
  Role role;
  std::optional<PropertyValue> (*read)(std::string_view) = nullptr;
  std::string_view expected = {};
};

// clang-format off
constexpr auto kElements = std::to_array<Element>({
    {"plist",   Role::kRoot},
    {"dict",    Role::kDictionary},
    {"array",   Role::kArray},
    {"key",     Role::kKey},
    {"string",  Role::kText},
    {"true",    Role::kFlag},
    {"false",   Role::kFlag},
    {"integer", Role::kScalar, IntegerFromText, "a 64-bit integer"},
    {"real",    Role::kScalar, RealFromText,    "a real number"},
    {"date",    Role::kScalar, DateFromText,    "a date such as 2026-03-04T05:06:07Z"},
    {"data",    Role::kScalar, DataFromText,    "base64"},
});
// clang-format on

// Every step gives false once something is wrong, and `error` says what.
class XmlReader {
 public:
  XmlReader(std::string_view document, const PropertyListLimits& limits)
      : text_(document), limits_(limits) {}

  PropertyListResult read() {
    if (!checkCharacters() || !readDocument()) return PropertyListError{error_};
    return std::move(root_);
  }

 private:
  struct Tag {
    std::string_view name;
    bool closes = false;
    bool isEmpty = false;
    bool hasAttributes = false;
  };
  struct Open {
    const Element* element;
    std::size_t firstElement = 0;  // of an array, in elements_
    Dictionary entries = {};
    std::optional<std::string> key = std::nullopt;  // read, and its value not yet
    bool isEmpty = true;
  };

  bool fail(std::size_t at, std::string_view what) {
    const auto line = 1 + std::ranges::count(text_.substr(0, at), '\n');
    error_ = FormatText("line %llu: %s", line, what);
    return false;
  }
  bool fail(std::string_view what) { return fail(at_, what); }

  bool atEnd() const { return at_ == text_.size(); }
  bool nextIs(std::string_view wanted) const { return text_.substr(at_).starts_with(wanted); }
  void skipBlanks() {
    while (at_ < text_.size() && IsBlank(text_[at_])) ++at_;
  }

  // Moves past the next `end`, having skipped `skip` bytes, and gives what lies between.
  bool takeUntil(std::size_t skip, std::string_view end, std::string_view construct,
                 std::string_view* content = nullptr) {
    const std::size_t first = at_ + skip;
    const std::size_t found = text_.find(end, first);
    if (found == std::string_view::npos) {
      return fail(FormatText("the document ends inside %s", construct));
    }
    if (content != nullptr) *content = text_.substr(first, found - first);
    at_ = found + end.size();
    return true;
  }

  bool checkCharacters() {
    const std::size_t valid = ValidUtf8Prefix(text_);
    const std::size_t held = XmlTextPrefix(text_.substr(0, valid));
    if (held < valid) return fail(held, "a character that XML cannot hold");
    return valid == text_.size() || fail(valid, "not valid UTF-8");
  }

  // At the very start: "<?xml version="1.0" encoding="UTF-8"?>". The bytes are taken for UTF-8, so
  // a document that calls itself anything else is refused.
  bool readDeclaration() {
    if (!nextIs("<?xml") || at_ + 5 == text_.size() || !IsBlank(text_[at_ + 5])) return true;
    const std::size_t start = at_;
    std::string_view content;
    if (!takeUntil(5, "?>", "the XML declaration", &content)) return false;
    const std::size_t encoding = content.find("encoding");
    if (encoding == std::string_view::npos) return true;
    const std::string name = Lowered(content.substr(encoding));
    const bool known =
        name.find("utf-8") != std::string::npos || name.find("us-ascii") != std::string::npos;
    return known || fail(start, "the document is not in UTF-8");
  }

  // A document type names the format, which is known; definitions inside it are refused.
  bool readDocumentType() {
    char quote = 0;
    for (std::size_t i = at_; i < text_.size(); ++i) {
      const char c = text_[i];
      if (quote != 0) {
        if (c == quote) quote = 0;
      } else if (c == '"' || c == '\'') {
        quote = c;
      } else if (c == '[') {
        return fail(i, "definitions inside the document type");
      } else if (c == '>') {
        at_ = i + 1;
        return true;
      }
    }
    return fail("the document ends inside the document type");
  }

  bool skipBetweenElements() {
    while (true) {
      skipBlanks();
      if (nextIs("<!--")) {
        if (!takeUntil(4, "-->", "a comment")) return false;
      } else if (nextIs("<?")) {
        if (!takeUntil(2, "?>", "a processing instruction")) return false;
      } else {
        return true;
      }
    }
  }

  // Of attributes only the end is found: the format has none that matter.
  bool readTag(Tag& tag) {
    const std::size_t start = at_++;
    tag.closes = nextIs("/");
    if (tag.closes) ++at_;
    const std::size_t name = at_;
    while (!atEnd() && IsNameCharacter(text_[at_])) ++at_;
    tag.name = text_.substr(name, at_ - name);
    if (!atEnd() && text_[at_] == '>' && !tag.name.empty()) {  // nearly every tag
      ++at_;
      return true;
    }
    const std::size_t rest = at_;
    char quote = 0;
    for (; !atEnd(); ++at_) {
      const char c = text_[at_];
      if (quote != 0 ? c == quote : c == '"' || c == '\'') quote = quote != 0 ? '\0' : c;
      if (c == '<' || (c == '>' && quote == 0)) break;
    }
    if (atEnd()) return fail(start, "the document ends inside a tag");
    std::string_view attributes = text_.substr(rest, at_ - rest);
    tag.isEmpty = attributes.ends_with('/');
    if (tag.isEmpty) attributes.remove_suffix(1);
    tag.hasAttributes = !Trimmed(attributes).empty();
    const bool separated = !tag.hasAttributes || IsBlank(attributes[0]);
    if (text_[at_] == '<' || tag.name.empty() || !separated || (tag.closes && tag.isEmpty)) {
      return fail(start, "a malformed tag");
    }
    ++at_;
    return true;
  }

  bool readReference(std::string& out) {
    const std::size_t start = at_;
    const std::size_t end = text_.find_first_of(";<&", start + 1);
    if (end == std::string_view::npos || text_[end] != ';') return fail("an & that names nothing");
    const auto character = XmlReference(text_.substr(start + 1, end - start - 1));
    if (!character) {
      return fail(
          FormatText("%s names no character", QuotedExcerpt(text_.substr(start, end - start + 1))));
    }
    out += *character;
    at_ = end + 1;
    return true;
  }

  // The text up to and including the end tag of `element`.
  bool readText(const Element& element, std::string& out) {
    while (true) {
      std::size_t plain = at_;
      while (plain < text_.size() && text_[plain] != '<' && text_[plain] != '&') ++plain;
      out += text_.substr(at_, plain - at_);
      at_ = plain;
      std::string_view section;
      if (atEnd()) return fail(FormatText("the document ends inside <%s>", element.name));
      if (nextIs("&")) {
        if (!readReference(out)) return false;
      } else if (nextIs("<![CDATA[")) {
        if (!takeUntil(9, "]]>", "a CDATA section", &section)) return false;
        out += section;
      } else if (nextIs("<!--") || nextIs("<?")) {
        if (!skipBetweenElements()) return false;
      } else {
        const std::size_t start = at_;
        Tag tag;
        if (!readTag(tag)) return false;
        if (tag.closes && tag.name == element.name && !tag.hasAttributes) return true;
        return fail(
            start, FormatText("<%s%s> inside <%s>", tag.closes ? "/" : "", tag.name, element.name));
      }
    }
  }

  // Whether a value or key of this kind may come next in `parent`.
  bool checkPlace(const Open& parent, const Element& element, std::size_t at) {
    if (element.role == Role::kRoot) return fail(at, "<plist> inside <plist>");
    const bool keyExpected = parent.element->role == Role::kDictionary && !parent.key;
    if (keyExpected != (element.role == Role::kKey)) {
      return fail(
          at, FormatText("<%s> where %s belongs", element.name, keyExpected ? "<key>" : "a value"));
    }
    if (parent.element->role == Role::kRoot && !parent.isEmpty) {
      return fail(at, FormatText("<%s>: a second value inside <plist>", element.name));
    }
    return true;
  }

  // An element that holds no other elements.
  bool readLeaf(const Element& element, const Tag& tag, std::size_t at) {
    std::string content;
    if (!tag.isEmpty && !readText(element, content)) return false;
    const auto refuse = [&](std::string_view expected) {
      return fail(at, FormatText("<%s> holds %s, which is not %s", element.name,
                                 QuotedExcerpt(content), expected));
    };
    if (element.role == Role::kFlag && !Trimmed(content).empty()) return refuse("empty");
    if (element.role == Role::kKey) {
      open_.back().key = std::move(content);
    } else if (element.role == Role::kFlag) {
      add(element.name == "true");
    } else if (element.role == Role::kText) {
      add(std::move(content));
    } else if (auto value = element.read(Trimmed(content))) {
      add(*std::move(value));
    } else {
      return refuse(element.expected);
    }
    return true;
  }

  // Puts a value where it belongs in what is open.
  void add(PropertyValue&& value) {
    Open& parent = open_.back();
    parent.isEmpty = false;
    if (parent.element->role == Role::kRoot) {
      root_ = std::move(value);
    } else if (parent.element->role == Role::kArray) {
      elements_.push_back(std::move(value));
    } else {
      parent.entries[*parent.key] = std::move(value);
      parent.key.reset();
    }
  }

  bool openElement(const Tag& tag, std::size_t at) {
    const auto* const element = std::ranges::find(kElements, tag.name, &Element::name);
    if (element == kElements.end())
      return fail(at, FormatText("unknown element %s", QuotedExcerpt(tag.name)));
    if (tag.hasAttributes) return fail(at, FormatText("<%s> has attributes", tag.name));
    Open& parent = open_.back();
    if (!checkPlace(parent, *element, at)) return false;
    if (element->role != Role::kKey && ++values_ > limits_.values) {
      return fail(at, TooManyValues(limits_));
    }
    if (element->role != Role::kDictionary && element->role != Role::kArray) {
      return readLeaf(*element, tag, at);
    }
    // <plist> is open beside the containers.
    if (open_.size() > kMaxPropertyListDepth) return fail(at, TooDeeplyNested());
    open_.push_back({element, elements_.size()});
    if (tag.isEmpty) closeContainer();
    return true;
  }

  // Makes a value of the innermost container, which is complete.
  void closeContainer() {
    const Open closed = std::move(open_.back());
    open_.pop_back();
    if (closed.element->role == Role::kDictionary) {
      add(closed.entries);
      return;
    }
    const auto first = elements_.begin() + static_cast<std::ptrdiff_t>(closed.firstElement);
    Array array;
    array.reserve(elements_.size() - closed.firstElement);
    for (auto element = first; element != elements_.end(); ++element) {
      array.push_back(std::move(*element));
    }
    elements_.erase(first, elements_.end());
    add(array);
  }

  bool closeElement(const Tag& tag, std::size_t at) {
    const Open& open = open_.back();
    if (tag.name != open.element->name || tag.hasAttributes) {
      return fail(at, FormatText("</%s> inside <%s>", tag.name, open.element->name));
    }
    if (open.key) return fail(at, "the last <key> of <dict> has no value");
    if (open.element->role == Role::kRoot && open.isEmpty) {
      return fail(at, "<plist> holds no value");
    }
    if (open.element->role == Role::kRoot) {
      open_.pop_back();
    } else {
      closeContainer();
    }
    return true;
  }

  bool readDocument() {
    if (nextIs("\xEF\xBB\xBF")) at_ += 3;
    if (!readDeclaration() || !skipBetweenElements()) return false;
    if (nextIs("<!") && at_ + 2 < text_.size() && IsLetter(text_[at_ + 2])) {
      if (!readDocumentType() || !skipBetweenElements()) return false;
    }
    const std::size_t start = at_;
    Tag root;
    if (!nextIs("<")) return fail("no <plist> element");
    if (!readTag(root)) return false;
    if (root.name != "plist" || root.closes) return fail(start, "no <plist> element");
    if (root.isEmpty) return fail(start, "<plist> holds no value");
    open_.push_back({kElements.begin()});
    while (!open_.empty()) {
      if (!readNextTag()) return false;
    }
    return skipBetweenElements() && (atEnd() || fail("text after </plist>"));
  }

  bool readNextTag() {
    if (!skipBetweenElements()) return false;
    const std::string_view inside = open_.back().element->name;
    if (atEnd()) return fail(FormatText("the document ends inside <%s>", inside));
    if (!nextIs("<")) return fail(FormatText("text inside <%s>", inside));
    const std::size_t at = at_;
    Tag tag;
    if (!readTag(tag)) return false;
    return tag.closes ? closeElement(tag, at) : openElement(tag, at);
  }

  std::string_view text_;
  const PropertyListLimits limits_;
  std::size_t at_ = 0;
  std::vector<Open> open_;
  std::vector<PropertyValue> elements_;  // of all open arrays, the innermost one's last
  PropertyValue root_;
  std::size_t values_ = 0;
  std::string error_;
};

}  // namespace

PropertyListResult ReadXmlPropertyList(std::string_view document,
                                       const PropertyListLimits& limits) {
  return XmlReader(document, limits).read();
}

}  // namespace quorlet
