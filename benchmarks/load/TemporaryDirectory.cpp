#include "load/TemporaryDirectory.h"

#include <cerrno>
#include <cstdlib>
#include <system_error>

namespace halyard::load {

TemporaryDirectory::TemporaryDirectory(const std::string& parent) {
    std::string pattern = parent + "/halyard-load.XXXXXX";
    if (::mkdtemp(pattern.data()) == nullptr) {
        throw std::system_error(errno, std::generic_category(), pattern);
    }
    path_ = pattern;
}

TemporaryDirectory::~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

} // namespace halyard::load
