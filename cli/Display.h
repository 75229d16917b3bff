/// Text for people: aligned by the width that a terminal gives it, nothing in it that a terminal obeys.
#pragma once

#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

namespace cli {

/// A text from outside as it may be shown: control and invisible characters, broken UTF-8 and the
/// backslash itself become escapes ("\n", "\x1b", "\u202e").
std::string shown(const std::string &text);

/// Columns that `shown` (UTF-8) takes on a terminal.
size_t shownWidth(const std::string &shown);

enum class Align {
    Left,
    Right
};

/// Rows under a line of titles.
class Table {
public:
    explicit Table(std::vector<std::pair<std::string, Align>> columns) : columns(std::move(columns)) {}

    /// One cell a column, as they come from outside.
    void add(std::vector<std::string> cells);

    /// The lines, each with its end; columns two spaces apart, no space at the end of a line.
    std::string text() const;

private:
    std::vector<std::pair<std::string, Align>> columns;
    std::vector<std::vector<std::string>> rows;
};

/// "Key:  value" lines, the values under each other.
std::string keyValues(const std::vector<std::pair<std::string, std::string>> &pairs);

} // namespace cli
