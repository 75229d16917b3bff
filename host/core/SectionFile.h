/// Files of sections:
///
///     [name]
///         key=value
///
/// A line without "=" means nothing, nor does one above the first header; both stay where they are. Of two sections
/// with one name the first counts.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace norvhost {

/// One section of a text.
struct Section {
    std::string_view name;
    std::string_view lines; ///< below the header
    std::string_view whole; ///< with the header
};

/// The sections of a text, which must outlive them.
std::vector<Section> splitSections(std::string_view text);

/// Takes a line apart: blanks around the key do not count, the value is all behind "=". False for other lines.
bool readKeyLine(std::string_view line, std::string_view &key, std::string_view &value);

/// Writes a key line of a format such as "\t%s=%s\n". False when the format is not of this form, or the texts would not
/// be read back as they are.
bool appendKeyLine(std::string_view format, std::string_view key, std::string_view value, std::string &lines);

} // namespace norvhost
