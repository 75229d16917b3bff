/// Whole files as texts, and what is read of one line.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace norvhost {

/// Reads to the end. 0, or a negative errno value: -EFBIG above the limit.
int readAll(int fd, size_t limit, std::string &text);

/// False on failure, errno says why.
bool writeAll(int fd, std::string_view text);

/// Without the blanks around it.
std::string_view trimmed(std::string_view text);

} // namespace norvhost
