// Renders snapshot exports of the storage controller as text: what the drive did in each interval.
//
// Both renderers write a legend and then one line for each interval, followed by a terminator, into
// a buffer of the caller. They give the number of characters without the terminator, or nothing
// when the text and its terminator do not fit; the buffer then holds the beginning of a text that
// is not terminated. More fields than characters count as not fitting.
#ifndef QUORLET_STORAGE_SNAPSHOT_H_
#define QUORLET_STORAGE_SNAPSHOT_H_

#include <cstddef>
#include <optional>
#include <span>

namespace quorlet {

// The part of a header without which nothing can be rendered.
inline constexpr std::size_t kSnapshotHeaderBytes = 28;

// Records of the fixed layout, 252 bytes each; what is left at the end is ignored. One empty line
// follows the last line.
std::optional<std::size_t> FSPParseSnapshotBuffer(std::span<const std::byte> records,
                                                  std::span<char> out);

// Records that `header` describes, the export of the snapshot header: it brings the record's size,
// the fields with their format texts and, from version 6 on, the legend. Records that do not lie
// within `records` and fields that do not lie within their record are left out, and so is a record
// whose first field is 0. A header that is missing (empty) or cut short gives nothing.
//
// A format text is data, not a format: its first conversions of the kind that the field has are
// filled (%u, %d, %i, %x, %X and %o for numbers, %s for the letters of a latency field; flags,
// width and precision of up to three digits, and any length modifier), "%%" is a percent sign, and
// everything else stays as it is.
std::optional<std::size_t> FSPParseSnapshotBufferWithInplaceParser(
    std::span<const std::byte> records, std::span<char> out, std::span<const std::byte> header);

}  // namespace quorlet

#endif  // QUORLET_STORAGE_SNAPSHOT_H_
