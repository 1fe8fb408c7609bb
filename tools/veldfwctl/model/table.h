// SPDX-License-Identifier: Apache-2.0
// Tables as text.
#ifndef VELDFWCTL_TABLE_H
#define VELDFWCTL_TABLE_H

#include <string>
#include <vector>

namespace veldfwctl {

/// How a cell is shown on a terminal with colours.
enum class Shade { PLAIN, GOOD, BAD, FAINT };

struct Cell {
    // Cells are mostly written as plain text.
    Cell(std::string content, Shade how = Shade::PLAIN) : text(std::move(content)), shade(how) {}
    Cell(const char *content, Shade how = Shade::PLAIN) : text(content), shade(how) {}

    std::string text;
    Shade shade;
};

struct Table {
    std::vector<std::string> headings;
    std::vector<std::vector<Cell>> rows;
};

/// Columns aligned by their width in characters (UTF-8), under headings.
std::string tableText(const Table &table, bool colour);
/// A line of tab-separated cells per row, without headings; tabs and line breaks in cells become blanks.
std::string tableFields(const Table &table);
/// Text in the colour of a shade, or as it is.
std::string shaded(const std::string &text, Shade shade, bool colour);

}  // namespace veldfwctl

#endif
