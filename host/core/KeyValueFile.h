/// Files of "key=value" lines.
///
/// Blanks around key and value do not count, a line that begins with '#' neither. A value may stand in single or
/// double quotes, which keep its blanks; there are no escapes. The first line with a key counts.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace norvhost {

/// The value of a key in such a text, nothing when the key is not there.
std::optional<std::string> findKeyValue(std::string_view text, std::string_view key);

} // namespace norvhost
