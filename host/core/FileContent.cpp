#include "host/core/FileContent.h"

#include <cerrno>
#include <unistd.h>

namespace norvhost {

int readAll(int fd, size_t limit, std::string &text)
{
    text.clear();
    char buffer[4096];
    for (;;) {
        const ssize_t count = read(fd, buffer, sizeof buffer);
        if (count == 0)
            return 0;
        if (count < 0 && errno != EINTR)
            return -errno;
        if (count > 0)
            text.append(buffer, static_cast<size_t>(count));
        if (text.size() > limit)
            return -EFBIG;
    }
}

bool writeAll(int fd, std::string_view text)
{
    while (!text.empty()) {
        const ssize_t count = write(fd, text.data(), text.size());
        if (count < 0 && errno != EINTR)
            return false;
        if (count > 0)
            text.remove_prefix(static_cast<size_t>(count));
    }
    return true;
}

std::string_view trimmed(std::string_view text)
{
    constexpr std::string_view blanks = " \t\r\v\f\n";
    const size_t begin = text.find_first_not_of(blanks);
    return begin == std::string_view::npos ? std::string_view()
                                           : text.substr(begin, text.find_last_not_of(blanks) + 1 - begin);
}

} // namespace norvhost
