#include "output/Table.h"

#include <algorithm>

#include "output/Sanitise.h"

namespace halyard::ctl {
namespace {

constexpr std::string_view kGap = "  ";
// Nothing is cut to less.
constexpr std::size_t kLeastCut = 6;

} // namespace

Table::Table(Terminal& terminal, std::vector<Column> columns)
    : terminal_(terminal), columns_(std::move(columns)) {}

bool Table::add(std::vector<Cell> cells) {
    for (Cell& cell : cells) {
        cell.text = cell.text.empty() ? "-" : sanitised(cell.text);
    }
    if (laidOut_) {
        writeLine(cells);
    } else {
        held_.push_back(std::move(cells));
        if (held_.size() >= kHeldBack) {
            layOut();
        }
    }
    return !terminal_.isBroken();
}

void Table::finish(std::string_view none) {
    if (!laidOut_ && held_.empty()) {
        terminal_.write(std::string(none) + "\n");
        return;
    }
    if (!laidOut_) {
        layOut();
    }
}

void Table::layOut() {
    laidOut_ = true;
    for (const Column& column : columns_) {
        widths_.push_back(displayWidth(column.title));
    }
    for (const Line& line : held_) {
        for (std::size_t i = 0; i < line.size(); ++i) {
            widths_[i] = std::max(widths_[i], displayWidth(line[i].text));
        }
    }
    fit();
    Line titles;
    for (const Column& column : columns_) {
        titles.emplace_back(column.title, Colour::Bold);
    }
    writeLine(titles);
    for (const Line& line : held_) {
        writeLine(line);
    }
    held_.clear();
}

std::size_t Table::neededRoom() const {
    std::size_t needed = 0;
    for (std::size_t i = 0; i < widths_.size(); ++i) {
        needed += dropped_[i] ? 0 : widths_[i] + (needed > 0 ? kGap.size() : 0);
    }
    return needed;
}

void Table::fit() {
    dropped_.assign(columns_.size(), false);
    while (terminal_.width() != 0 && neededRoom() > terminal_.width() &&
           (shrinkWidest() || dropLeast())) {
    }
}

// False when all that may shrink has.
bool Table::shrinkWidest() {
    std::size_t widest = columns_.size();
    for (std::size_t i = 0; i < columns_.size(); ++i) {
        const bool shrinks = columns_[i].shrinks && !dropped_[i] && widths_[i] > kLeastCut;
        if (shrinks && (widest == columns_.size() || widths_[i] > widths_[widest])) {
            widest = i;
        }
    }
    if (widest == columns_.size()) {
        return false;
    }
    --widths_[widest];
    return true;
}

// False when all that may go has gone.
bool Table::dropLeast() {
    std::size_t least = columns_.size();
    for (std::size_t i = 0; i < columns_.size(); ++i) {
        const bool goes = columns_[i].rank > 0 && !dropped_[i];
        if (goes && (least == columns_.size() || columns_[i].rank < columns_[least].rank)) {
            least = i;
        }
    }
    if (least == columns_.size()) {
        return false;
    }
    dropped_[least] = true;
    return true;
}

void Table::writeLine(const Line& line) {
    std::string out;
    std::string blanks; // before the next cell
    for (std::size_t i = 0; i < line.size(); ++i) {
        if (dropped_[i]) {
            continue;
        }
        const bool cut = terminal_.width() != 0 && columns_[i].shrinks;
        const std::string text = cut ? shortened(line[i].text, widths_[i]) : line[i].text;
        const std::size_t width = displayWidth(text);
        const std::string fill(width < widths_[i] ? widths_[i] - width : 0, ' ');
        const bool right = columns_[i].align == Column::Align::Right;
        out += blanks + (right ? fill : "") + coloured(terminal_, line[i].colour, text);
        blanks = (right ? "" : fill) + std::string(kGap);
    }
    terminal_.write(out + "\n");
}

} // namespace halyard::ctl
