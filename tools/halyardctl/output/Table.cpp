#include "output/Table.h"

#include <algorithm>
#include <numeric>

#include "output/Sanitise.h"

namespace halyard::ctl {
namespace {

constexpr std::string_view kGap = "  ";
// Nothing is cut to less.
constexpr std::size_t kLeastCut = 8;

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
    fit(widths_);
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

// Takes cells from the widest of the columns that may shrink, until the line fits.
void Table::fit(std::vector<std::size_t>& widths) const {
    const std::size_t room = terminal_.width();
    const auto needed = [&] {
        return std::accumulate(widths.begin(), widths.end(), kGap.size() * (widths.size() - 1));
    };
    while (room != 0 && needed() > room) {
        std::size_t widest = columns_.size();
        for (std::size_t i = 0; i < columns_.size(); ++i) {
            if (columns_[i].shrinks && (widest == columns_.size() || widths[i] > widths[widest])) {
                widest = i;
            }
        }
        if (widest == columns_.size() || widths[widest] <= kLeastCut) {
            return;
        }
        --widths[widest];
    }
}

void Table::writeLine(const Line& line) {
    std::string out;
    for (std::size_t i = 0; i < line.size(); ++i) {
        const bool cut = terminal_.width() != 0 && columns_[i].shrinks;
        const std::string text = cut ? shortened(line[i].text, widths_[i]) : line[i].text;
        const std::size_t width = displayWidth(text);
        const std::string blanks(width < widths_[i] ? widths_[i] - width : 0, ' ');
        const std::string shown = coloured(terminal_, line[i].colour, text);
        const bool last = i + 1 == line.size();
        if (columns_[i].align == Column::Align::Right) {
            out += blanks + shown;
        } else {
            out += last ? shown : shown + blanks;
        }
        out += last ? "\n" : kGap;
    }
    terminal_.write(out);
}

} // namespace halyard::ctl
