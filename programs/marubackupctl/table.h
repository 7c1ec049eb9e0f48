#pragma once

#include <memory>
#include <string>
#include <vector>

struct libscols_table;

/**
 * Lines of text in aligned columns below a header. Nothing is cut, folded or
 * coloured, and an empty cell reads "-", so that programs can read it too.
 */
class Table {
public:
    explicit Table(const std::vector<std::string>& names);

    /** Adds a line: a text for each column, in any bytes. */
    void add(const std::vector<std::string>& cells);
    /** The header and the lines. */
    std::string text() const;

private:
    std::string header;
    bool empty = true;
    std::shared_ptr<libscols_table> table;
};
