#include "table.h"

#include <cstdlib>
#include <new>

#include <libsmartcols/libsmartcols.h>

#include "words.h"

namespace {

/** Passes on what the library made; it fails for want of memory only. */
template <typename Thing>
Thing* made(Thing* thing) {
    if (thing == nullptr) {
        throw std::bad_alloc();
    }
    return thing;
}

void mustSucceed(int result) {
    if (result != 0) {
        throw std::bad_alloc();
    }
}

} // namespace

Table::Table(const std::vector<std::string>& names) : table(made(scols_new_table()), scols_unref_table) {
    // Cells are made printable here, in a way that shows a backslash as what it is.
    mustSucceed(scols_table_enable_noencoding(table.get(), 1));
    for (const std::string& name : names) {
        made(scols_table_new_column(table.get(), name.c_str(), 0, 0));
        header += (header.empty() ? "" : " ") + name;
    }
}

void Table::add(const std::vector<std::string>& cells) {
    libscols_line* line = made(scols_table_new_line(table.get(), nullptr));
    for (std::size_t column = 0; column < cells.size(); ++column) {
        const std::string shown = cells[column].empty() ? "-" : printable(cells[column]);
        mustSucceed(scols_line_set_data(line, column, shown.c_str()));
    }
    empty = false;
}

std::string Table::text() const {
    if (empty) {
        return header + "\n"; // the library prints nothing at all
    }
    char* printed = nullptr;
    mustSucceed(scols_print_table_to_string(table.get(), &printed));
    const std::unique_ptr<char, decltype(&std::free)> owner(printed, std::free);
    return std::string(printed) + "\n";
}
