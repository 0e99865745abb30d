// Binary documents:
//   "bplist00", objects, offset table, trailer
// The trailer's 32 bytes are 6 unused ones, the size of an offset, the size of a reference, then
// the number of objects, the root's index and the offset table's position in 8 bytes each. An
// object is a marker byte, type in the high half and count in the low one, and its content.
// Everything is big-endian.
//
// Objects may be shared and may form cycles, so the tree may be far larger than the document: it is
// measured first, object by object, and built when it is within the limits.
#include "values/property_list_binary.h"

#include <algorithm>
#include <bit>
#include <cstdint>
#include <limits>
#include <optional>
#include <utility>
#include <vector>

#include "values/byte_reader.h"
#include "values/property_list_errors.h"
#include "values/text.h"

namespace quorlet {
namespace {

constexpr std::size_t kHeaderSize = 8;
constexpr std::size_t kTrailerSize = 32;
constexpr std::size_t kMaxWidth = 8;
constexpr double kEpoch2001 = 978307200;  // dates count from 2001-01-01T00:00:00Z

// Every step gives false once something is wrong, and `error_` says what.
class BinaryReader {
 public:
  BinaryReader(std::span<const std::byte> document, const PropertyListLimits& limits)
      : document_(document), limits_(limits) {}

  PropertyListResult read() {
    if (!readTrailer() || !walk(root_, 0)) return PropertyListError{error_};
    return valueOf(root_);
  }

 private:
  enum class State : std::uint8_t { kNew, kOpen, kDone };
  // What is known of an object; an object that is met again costs nothing.
  struct Memo {
    State state = State::kNew;
    bool isString = false;
    std::uint8_t height = 0;    // levels of containers, itself included
    std::uint32_t values = 1;   // itself included
    std::uint64_t content = 0;  // bytes of strings, keys and data
  };

  bool fail(std::string_view what) {
    error_ = what;
    return false;
  }
  bool fail(std::size_t object, std::string_view what) {
    return fail(FormatText("object %llu %s", object, what));
  }

  bool readTrailer() {
    if (document_.size() < kHeaderSize + kTrailerSize) return fail("the document is too short");
    const std::size_t end = document_.size() - kTrailerSize;
    ByteReader trailer(document_.last(kTrailerSize));
    trailer.skip(6);
    offsetWidth_ = static_cast<std::size_t>(trailer.big(1));
    referenceWidth_ = static_cast<std::size_t>(trailer.big(1));
    const std::uint64_t objects = trailer.big(8);
    const std::uint64_t root = trailer.big(8);
    const std::uint64_t table = trailer.big(8);
    if (offsetWidth_ < 1 || offsetWidth_ > kMaxWidth || referenceWidth_ < 1 ||
        referenceWidth_ > kMaxWidth) {
      return fail("the trailer holds impossible sizes");
    }
    if (objects > limits_.values) {
      return fail(FormatText("more than %llu objects", limits_.values));
    }
    if (table < kHeaderSize || table > end || objects * offsetWidth_ > end - table) {
      return fail("the offset table lies outside of the document");
    }
    if (root >= objects) return fail("the root object does not exist");
    table_ = static_cast<std::size_t>(table);
    root_ = static_cast<std::size_t>(root);
    memos_.resize(static_cast<std::size_t>(objects));
    return true;
  }

  // A reader at the object's marker, which ends where the offset table begins.
  ByteReader readerAt(std::size_t object) const {
    ByteReader offsets(document_.subspan(table_ + object * offsetWidth_));
    const std::uint64_t offset = offsets.big(offsetWidth_);
    ByteReader reader(document_.first(table_));
    // What does not fit a size_t is beyond the end as well.
    reader.seek(offset < kHeaderSize || offset > table_ ? std::numeric_limits<std::size_t>::max()
                                                        : static_cast<std::size_t>(offset));
    return reader;
  }

  // Fills in the memo of `object`, which has `above` containers around it. The recursion is bounded
  // by that number; the work is by the memos: what is read here adds up to no more than the values
  // and the content of the whole tree, which have their limits.
  bool walk(std::size_t object, std::size_t above) {
    Memo& memo = memos_[object];
    if (memo.state == State::kOpen) return fail(object, "contains itself");
    if (memo.state == State::kNew) {
      memo.state = State::kOpen;
      if (!readObject(object, memo, above)) return false;
      memo.state = State::kDone;
    }
    // One that was read before may be reached deeper down here.
    return above + memo.height <= kMaxPropertyListDepth ||
           fail(object, FormatText("is %s", TooDeeplyNested()));
  }

  bool readObject(std::size_t object, Memo& memo, std::size_t above) {
    ByteReader reader = readerAt(object);
    const auto marker = static_cast<unsigned>(reader.big(1));
    if (!reader.ok()) return fail(object, "lies outside of the document");
    const unsigned type = marker >> 4;
    switch (type) {
      case 0x0:
        return marker == 0x08 || marker == 0x09 || failUnknown(object);
      case 0x1:
        return readInteger(object, reader, marker & 0x0F);
      case 0x2:
        return marker == 0x22 || marker == 0x23 ? readScalar(object, reader, marker & 0x0F)
                                                : failUnknown(object);
      case 0x3:
        return marker == 0x33 ? readScalar(object, reader, 3) : failUnknown(object);
      case 0x4:
      case 0x5:
      case 0x6:
        memo.isString = type != 0x4;
        return readContent(object, memo, reader, marker);
      case 0x8:
        return fail(object, "is a UID, which is not supported");
      case 0xA:
      case 0xD:
        return readContainer(object, memo, reader, marker, above);
      case 0xB:
      case 0xC:
        return fail(object, "is a set, which is not supported");
      default:
        return failUnknown(object);
    }
  }

  bool failUnknown(std::size_t object) { return fail(object, "is of an unknown type"); }
  bool failCut(std::size_t object) { return fail(object, "does not end inside the document"); }

  bool readScalar(std::size_t object, ByteReader& reader, unsigned sizeExponent) {
    reader.skip(std::size_t{1} << sizeExponent);
    return reader.ok() || failCut(object);
  }

  bool readInteger(std::size_t object, ByteReader& reader, unsigned sizeExponent) {
    if (sizeExponent > 4) return failUnknown(object);
    if (sizeExponent < 4) return readScalar(object, reader, sizeExponent);
    // 16 bytes are how numbers above 2^63 - 1 are written.
    const std::uint64_t high = reader.big(8);
    reader.skip(8);
    if (!reader.ok()) return failCut(object);
    return high == 0 || fail(object, "is an integer beyond 64 bits");
  }

  // The count in the marker's low half, or, when that is 15, in an integer after it.
  bool readCount(std::size_t object, ByteReader& reader, unsigned marker, std::uint64_t& count) {
    count = marker & 0x0F;
    if (count == 0x0F) {
      const auto integer = static_cast<unsigned>(reader.big(1));
      if (reader.ok() && (integer < 0x10 || integer > 0x13)) return fail(object, "has no count");
      count = reader.big(std::size_t{1} << (integer & 3));
    }
    return reader.ok() || failCut(object);
  }

  bool readContent(std::size_t object, Memo& memo, ByteReader& reader, unsigned marker) {
    std::uint64_t count = 0;
    if (!readCount(object, reader, marker, count)) return false;
    const std::size_t unit = marker >> 4 == 0x6 ? 2 : 1;
    if (count > reader.remaining() / unit) return failCut(object);
    const auto content = reader.take(static_cast<std::size_t>(count) * unit);
    memo.content = content.size();
    seenContent_ += content.size();
    if (seenContent_ > limits_.content) return fail(TooMuchContent(limits_));
    for (std::size_t i = 0; memo.isString && i < content.size(); i += unit) {
      const auto character = content.subspan(i, unit);
      if (std::ranges::all_of(character, [](std::byte b) { return b == std::byte{0}; })) {
        return fail(object, "is a string with a null character");
      }
    }
    return true;
  }

  bool readContainer(std::size_t object, Memo& memo, ByteReader& reader, unsigned marker,
                     std::size_t above) {
    std::uint64_t count = 0;
    if (!readCount(object, reader, marker, count)) return false;
    const std::size_t keys = marker >> 4 == 0xD ? 1 : 0;
    if (count > reader.remaining() / referenceWidth_ / (1 + keys)) return failCut(object);
    seenValues_ += count;
    if (seenValues_ > limits_.values) return fail(TooManyValues(limits_));
    memo.height = 1;
    if (above == kMaxPropertyListDepth) return fail(object, FormatText("is %s", TooDeeplyNested()));
    for (std::uint64_t i = 0; i < count * keys; ++i) {
      if (!readElement(object, memo, reader, above, true)) return false;
    }
    for (std::uint64_t i = 0; i < count; ++i) {
      if (!readElement(object, memo, reader, above, false)) return false;
    }
    return true;
  }

  // One reference of the container, the memo of which grows by what it leads to.
  bool readElement(std::size_t container, Memo& memo, ByteReader& reader, std::size_t above,
                   bool isKey) {
    const std::uint64_t reference = reader.big(referenceWidth_);
    if (reference >= memos_.size())
      return fail(container, "refers to an object that does not exist");
    const auto object = static_cast<std::size_t>(reference);
    if (!walk(object, above + 1)) return false;
    const Memo& element = memos_[object];
    if (isKey && !element.isString) return fail(container, "has a key that is not a string");
    memo.height =
        std::max<std::uint8_t>(memo.height, static_cast<std::uint8_t>(element.height + 1));
    memo.content += element.content;
    if (!isKey) memo.values += element.values;
    if (memo.values > limits_.values) return fail(TooManyValues(limits_));
    return memo.content <= limits_.content || fail(TooMuchContent(limits_));
  }

  // --- Building: what is read here was found good before
  // -------------------------------------------

  PropertyValue valueOf(std::size_t object) const {
    ByteReader reader = readerAt(object);
    const auto marker = static_cast<unsigned>(reader.big(1));
    switch (marker >> 4) {
      case 0x0:
        return marker == 0x09;
      case 0x1:
        return integerAt(reader, marker & 0x0F);
      case 0x2:
        return Double(marker == 0x22
                          ? std::bit_cast<float>(static_cast<std::uint32_t>(reader.big(4)))
                          : std::bit_cast<double>(reader.big(8)));
      case 0x3:
        return Date{std::bit_cast<double>(reader.big(8)) + kEpoch2001};
      case 0x4: {
        const auto bytes = reader.take(countAt(reader, marker));
        return Data(bytes.begin(), bytes.end());
      }
      case 0xA:
        return arrayAt(reader, marker);
      case 0xD:
        return dictionaryAt(reader, marker);
      default:
        return textAt(reader, marker);
    }
  }

  static std::size_t countAt(ByteReader& reader, unsigned marker) {
    const unsigned count = marker & 0x0F;
    return count < 0x0F
               ? count
               : static_cast<std::size_t>(reader.big(std::size_t{1} << (reader.big(1) & 3)));
  }

  // Only integers of 8 bytes have a sign.
  static PropertyValue integerAt(ByteReader& reader, unsigned sizeExponent) {
    if (sizeExponent == 4) reader.skip(8);
    const std::uint64_t bits = reader.big(std::min(std::size_t{1} << sizeExponent, kMaxWidth));
    if (sizeExponent == 4 && !std::in_range<std::int64_t>(bits)) return UInt64(bits);
    return Int64(static_cast<std::int64_t>(bits));
  }

  static std::string textAt(ByteReader& reader, unsigned marker) {
    std::size_t count = countAt(reader, marker);
    if (marker >> 4 == 0x5) {
      const auto bytes = reader.take(count);
      return RepairUtf8({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
    }
    std::string text;
    for (; count > 0; --count) AppendUtf8(text, characterAt(reader, count));
    return text;
  }

  // One character of UTF-16, of which `left` units are left; U+FFFD for half of one.
  static std::uint32_t characterAt(ByteReader& reader, std::size_t& left) {
    constexpr std::uint32_t kReplacement = 0xFFFD;
    const auto first = static_cast<std::uint32_t>(reader.big(2));
    if (first < 0xD800 || first > 0xDFFF) return first;
    ByteReader ahead = reader;
    const auto second = static_cast<std::uint32_t>(ahead.big(2));
    if (first > 0xDBFF || left == 1 || second < 0xDC00 || second > 0xDFFF) return kReplacement;
    reader = ahead;
    --left;
    return 0x10000 + ((first - 0xD800) << 10) + (second - 0xDC00);
  }

  std::size_t referenceAt(ByteReader& reader) const {
    return static_cast<std::size_t>(reader.big(referenceWidth_));
  }

  PropertyValue arrayAt(ByteReader& reader, unsigned marker) const {
    std::size_t count = countAt(reader, marker);
    Array array;
    array.reserve(count);
    for (; count > 0; --count) array.push_back(valueOf(referenceAt(reader)));
    return array;
  }

  PropertyValue dictionaryAt(ByteReader& reader, unsigned marker) const {
    const std::size_t count = countAt(reader, marker);
    ByteReader values = reader;
    values.skip(count * referenceWidth_);
    Dictionary dictionary;
    for (std::size_t i = 0; i < count; ++i) {
      const PropertyValue key = valueOf(referenceAt(reader));
      dictionary[*key.asString()] = valueOf(referenceAt(values));
    }
    return dictionary;
  }

  std::span<const std::byte> document_;
  const PropertyListLimits limits_;
  std::size_t offsetWidth_ = 0;
  std::size_t referenceWidth_ = 0;
  std::size_t table_ = 0;
  std::size_t root_ = 0;
  std::vector<Memo> memos_;
  // Of the distinct objects, so that many large ones in the same bytes cannot cost much.
  std::uint64_t seenValues_ = 0;
  std::uint64_t seenContent_ = 0;
  std::string error_;
};

}  // namespace

PropertyListResult ReadBinaryPropertyList(std::span<const std::byte> document,
                                          const PropertyListLimits& limits) {
  return BinaryReader(document, limits).read();
}

}  // namespace quorlet
