// Why a command could not do what it was asked, and the status that the program
// ends with for it.
//
// A value; any thread.
#pragma once

#include <string>
#include <utility>

#include "common/Result.h"

namespace halyard::reading {

// Scripts go by these numbers.
enum class Exit : int {
    Done = 0,
    Failed = 1,
    WrongUse = 2,
    NothingThere = 3, // no daemon, or no store
    NotAllowed = 4,
};

struct Trouble : Failure {
    Trouble(Exit with, std::string why) : Failure{{}, std::move(why)}, exit(with) {}
    Exit exit;
    bool isDamage = false; // of the store
};

template <class T> using Outcome = Result<T, Trouble>;

} // namespace halyard::reading
