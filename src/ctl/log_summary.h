// A log as a terminal shows it.
#ifndef QUORLET_CTL_LOG_SUMMARY_H_
#define QUORLET_CTL_LOG_SUMMARY_H_

#include <cstddef>
#include <string>

#include "ctl/export_log.h"

namespace quorlet {

// Lines of at most `columns` columns: scalars with their units, distributions in a line each,
// histograms as bars. A number is never cut; a key that is too long has a line of its own.
std::string LogSummary(const ExportedLog& log, std::size_t columns);

}  // namespace quorlet

#endif  // QUORLET_CTL_LOG_SUMMARY_H_
