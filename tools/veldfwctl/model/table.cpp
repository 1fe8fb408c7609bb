// SPDX-License-Identifier: Apache-2.0
// Tables as text.
#include "model/table.h"

#include <algorithm>

namespace veldfwctl {

namespace {

size_t characters(const std::string &text) {
    return static_cast<size_t>(
        std::count_if(text.begin(), text.end(), [](char c) { return (static_cast<unsigned char>(c) & 0xC0) != 0x80; }));
}

/// What a file or an interface name may hold must not steer the terminal or break the row.
std::string printable(std::string text) {
    for (char &c : text) {
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) {
            c = ' ';
        }
    }
    return text;
}

}  // namespace

std::string shaded(const std::string &text, Shade shade, bool colour) {
    if (!colour || shade == Shade::PLAIN) {
        return text;
    }
    const char *code = shade == Shade::GOOD ? "32" : shade == Shade::BAD ? "31" : "2";
    return std::string("\033[") + code + "m" + text + "\033[0m";
}

std::string tableText(const Table &table, bool colour) {
    std::vector<size_t> widths;
    const auto measure = [&widths](size_t column, const std::string &text) {
        widths.resize(std::max(widths.size(), column + 1));
        widths[column] = std::max(widths[column], characters(text));
    };
    for (size_t i = 0; i < table.headings.size(); ++i) {
        measure(i, table.headings[i]);
    }
    for (const std::vector<Cell> &row : table.rows) {
        for (size_t i = 0; i < row.size(); ++i) {
            measure(i, row[i].text);
        }
    }
    std::string text;
    const auto cellAppend = [&](const std::string &content, Shade shade, size_t column, bool isLast) {
        const std::string shown = printable(content);
        text += shaded(shown, shade, colour);
        if (!isLast) {
            text.append(widths[column] - characters(shown) + 2, ' ');
        }
    };
    for (size_t i = 0; i < table.headings.size(); ++i) {
        cellAppend(table.headings[i], Shade::FAINT, i, i + 1 == table.headings.size());
    }
    text += '\n';
    for (const std::vector<Cell> &row : table.rows) {
        for (size_t i = 0; i < row.size(); ++i) {
            cellAppend(row[i].text, row[i].shade, i, i + 1 == row.size());
        }
        text += '\n';
    }
    return text;
}

std::string tableFields(const Table &table) {
    std::string text;
    for (const std::vector<Cell> &row : table.rows) {
        for (size_t i = 0; i < row.size(); ++i) {
            text += (i > 0 ? "\t" : "") + printable(row[i].text);
        }
        text += '\n';
    }
    return text;
}

}  // namespace veldfwctl
