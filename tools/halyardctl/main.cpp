// halyardctl: shows what halyardd knows, to people and to programs.
#include <chrono>

#include "CommandLine.h"

int main(int count, char** words) {
    using namespace halyard::ctl;
    Terminal terminal;
    const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
    Context context{terminal, now.count()};
    return static_cast<int>(runCommandLine(context, count, words));
}
