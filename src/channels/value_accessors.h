// Reading records of a sample: what the value accessors, deltas and descriptions share.
#ifndef QUORLET_CHANNELS_VALUE_ACCESSORS_H_
#define QUORLET_CHANNELS_VALUE_ACCESSORS_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>

#include "channels/channel.h"
#include "drvreport/drvreport.h"
#include "values/byte_reader.h"

namespace quorlet {

// The four values of one record.
using ElementValues = std::array<std::int64_t, 4>;

// A sample's records of one format; borrows them from the sample.
class ElementRun {
 public:
  // Nothing when the sample has no records of that format.
  static std::optional<ElementRun> Of(const Dictionary& sample, std::uint8_t format);
  // The same, when also the type word is of that format and counts as many elements as there are
  // records: only then does an index name a state or a bucket.
  static std::optional<ElementRun> Counted(const Dictionary& sample, std::uint8_t format);

  std::size_t count() const { return count_; }
  // `index` must be below count().
  ElementValues values(std::size_t index) const;
  std::uint64_t channelID(std::size_t index) const;
  std::uint64_t updateTime(std::size_t index) const;

 private:
  ElementRun(const std::byte* records, std::size_t count) : records_(records), count_(count) {}
  ByteReader at(std::size_t index, std::size_t offset) const;

  const std::byte* records_;
  std::size_t count_;
};

// The values of one state: ID, transitions into it, residency. kKernelError, and nothing written,
// when there is no such state or the records do not agree with the type word.
KernelReturn _getStateElement(const Dictionary& sample, std::int32_t index, ElementValues& values);
// The values of one bucket: hits, minimum, maximum, sum; failures as above.
KernelReturn _getHistogramElement(const Dictionary& sample, std::int32_t index,
                                  ElementValues& values);

// The names of all states, made and kept in the sample ("StateNames") when they are not there yet;
// owned by the sample. nullptr when one state has no name. Never refreshed once it is there.
const Array* getStateNames(Dictionary& sample);

// The residencies of all states added modulo 2^64; nothing when they cannot be read.
std::optional<std::uint64_t> sumOfResidencies(const Dictionary& sample);
// `residency` as a share of `sum`; NaN when there is no sum or it is 0.
double dutyCycle(std::int64_t residency, std::optional<std::uint64_t> sum);

}  // namespace quorlet

#endif  // QUORLET_CHANNELS_VALUE_ACCESSORS_H_
