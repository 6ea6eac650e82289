// When the device's owner agreed to what is sent, as the daemon noted it.
//
// A value; any thread may read it.
#pragma once

#include <cstddef>
#include <vector>

namespace halyard::exporting {

class ConsentHistory {
public:
    struct Note {
        bool given = false;
        double time = 0;

        bool operator==(const Note&) const = default;
    };

    // Nobody ever agreed.
    ConsentHistory() = default;
    bool operator==(const ConsentHistory&) const = default;
    // In the order in which they were made.
    explicit ConsentHistory(std::vector<Note> notes) : notes_(std::move(notes)) {}
    // For who only wants to see what would leave.
    static ConsentHistory always();

    bool isGivenAt(double time) const;
    // From one to the other, both included.
    bool isGivenThroughout(double from, double to) const;

private:
    double endOfRefusal(std::size_t refusal) const;

    std::vector<Note> notes_;
    bool always_ = false;
};

} // namespace halyard::exporting
