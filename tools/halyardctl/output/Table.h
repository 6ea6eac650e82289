// Rows for people, in columns.
//
// The first rows are held back until it is known how wide their columns are; what
// comes later goes straight through, so that a table of any length takes the memory
// of its beginning. On a terminal, lines are as long as it is wide: columns that may
// shrink are cut, and when that is not enough, the least important ones are left out. Elsewhere
// nothing is cut, and scripts find the columns in their order.
//
// Not thread-safe.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "output/Terminal.h"

namespace halyard::ctl {

struct Cell {
    Cell(std::string_view of, Colour in = Colour::Plain) : text(of), colour(in) {}
    Cell(const std::string& of, Colour in = Colour::Plain) : text(of), colour(in) {}
    Cell(const char* of, Colour in = Colour::Plain) : text(of), colour(in) {}
    std::string text; // Anything; the table sanitises it.
    Colour colour = Colour::Plain;
};

class Table {
public:
    struct Column {
        std::string title;
        enum class Align { Left, Right } align = Align::Left;
        bool shrinks = false;
        // Where there is no room left, the column of the least of these goes first; one
        // with 0 stays.
        int rank = 0;
    };

    // Borrows the terminal.
    Table(Terminal& terminal, std::vector<Column> columns);

    // Requires a cell for each column. False when nobody reads on.
    bool add(std::vector<Cell> cells);
    // Once, last. `none` stands where there is no row.
    void finish(std::string_view none);

private:
    static constexpr std::size_t kHeldBack = 500;
    using Line = std::vector<Cell>;

    void layOut();
    void writeLine(const Line& line);
    std::size_t neededRoom() const;
    void fit();
    bool shrinkWidest();
    bool dropLeast();

    Terminal& terminal_;
    const std::vector<Column> columns_;
    std::vector<Line> held_;
    std::vector<std::size_t> widths_;
    std::vector<bool> dropped_;
    bool laidOut_ = false;
};

} // namespace halyard::ctl
