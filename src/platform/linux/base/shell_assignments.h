// Files of shell-like assignments, such as os-release and locale.conf.
#ifndef QUORLET_PLATFORM_LINUX_BASE_SHELL_ASSIGNMENTS_H_
#define QUORLET_PLATFORM_LINUX_BASE_SHELL_ASSIGNMENTS_H_

#include <functional>
#include <map>
#include <string>
#include <string_view>

namespace quorlet {

using ShellAssignments = std::map<std::string, std::string, std::less<>>;

// Reads NAME=value lines: values in single or double quotes or none, backslash escapes, comments
// with "#"; a value without quotes may hold blanks. The last assignment of a name counts. A line
// that is none of that is skipped. Ill-formed UTF-8 becomes U+FFFD.
ShellAssignments ParseShellAssignments(std::string_view text);

}  // namespace quorlet

#endif  // QUORLET_PLATFORM_LINUX_BASE_SHELL_ASSIGNMENTS_H_
