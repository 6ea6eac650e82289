#include "linux/store/StoreAge.h"

#include <algorithm>
#include <utility>

namespace halyard::linux_ {
namespace {

// A clock that jumps more often has no meaning any more.
constexpr std::size_t kMostJumps = 16;

constexpr const char* kCreate =
    "CREATE TABLE IF NOT EXISTS clock_jump(id INTEGER PRIMARY KEY, \"to\" REAL, seconds REAL);"
    "DELETE FROM clock_jump";
constexpr const char* kIsThere =
    "SELECT 1 FROM sqlite_schema WHERE type = 'table' AND name = 'clock_jump'";
constexpr const char* kRead = "SELECT \"to\", seconds FROM clock_jump ORDER BY id";
constexpr const char* kInsert = "INSERT INTO clock_jump(\"to\", seconds) VALUES(?, ?)";

double seconds(std::chrono::nanoseconds time) {
    return std::chrono::duration<double>(time).count();
}

} // namespace

StoreAge::StoreAge(const platform::Clock& clock)
    : clock_(clock), wall_(platform::secondsSince1970(clock.wallTime())),
      uptime_(seconds(clock.systemUptime())) {}

StoreResult StoreAge::update(StoreDatabase& database) {
    int code = SQLITE_OK;
    if (generation_ != database.generation()) {
        code = generation_ == 0 ? read(database.handle()) : SQLITE_OK;
        unwritten_ = unwritten_ || (generation_ != 0 && !jumps_.empty());
        generation_ = code == SQLITE_OK ? database.generation() : generation_;
    }
    look();
    code = code == SQLITE_OK && unwritten_ ? write(database.handle()) : code;
    return database.resultOf(code);
}

bool StoreAge::hasNews() {
    look();
    return unwritten_;
}

void StoreAge::look() {
    const double wall = platform::secondsSince1970(clock_.wallTime());
    const double uptime = seconds(clock_.systemUptime());
    const double jumped = (wall - wall_) - (uptime - uptime_);
    if (jumped > kLeastJump) {
        forward(wall, jumped); // At the latest by now.
    } else if (jumped < -kLeastJump) {
        back(-jumped);
    }
    wall_ = wall;
    uptime_ = uptime;
}

void StoreAge::forward(double to, double seconds) {
    if (jumps_.size() == kMostJumps) {
        jumps_.erase(jumps_.begin());
    }
    jumps_.push_back({to, seconds});
    unwritten_ = true;
}

void StoreAge::back(double seconds) {
    while (seconds > 0 && !jumps_.empty()) {
        Jump& last = jumps_.back();
        const double taken = std::min(seconds, last.seconds);
        last.to -= taken;
        last.seconds -= taken;
        seconds -= taken;
        unwritten_ = true;
        if (last.seconds > kLeastJump) {
            return;
        }
        jumps_.pop_back();
    }
}

double StoreAge::oldest(std::chrono::seconds maxAge) {
    double moment = wall_ - static_cast<double>(maxAge.count());
    for (auto jump = jumps_.rbegin(); jump != jumps_.rend(); ++jump) {
        if (moment >= jump->to) {
            // It and those before are older than any row.
            jumps_.erase(jumps_.begin(), jump.base());
            unwritten_ = true;
            break;
        }
        moment -= jump->seconds;
    }
    return moment;
}

int StoreAge::read(sqlite3* database) {
    StoreStatement rows;
    int code = rows.prepare(database, kIsThere);
    code = code == SQLITE_OK ? rows.step() : code;
    if (code != SQLITE_ROW) {
        return code == SQLITE_DONE ? SQLITE_OK : code;
    }
    code = rows.prepare(database, kRead);
    std::vector<Jump> found;
    while (code == SQLITE_OK || code == SQLITE_ROW) {
        code = rows.step();
        // One that lies ahead was undone while no daemon ran.
        if (code == SQLITE_ROW && found.size() < kMostJumps && rows.real(0) <= wall_) {
            found.push_back({rows.real(0), rows.real(1)});
        }
    }
    jumps_.insert(jumps_.begin(), found.begin(), found.end());
    return code == SQLITE_DONE ? SQLITE_OK : code;
}

int StoreAge::write(sqlite3* database) {
    int code = sqlite3_exec(database, kCreate, nullptr, nullptr, nullptr);
    StoreStatement insert;
    code = code == SQLITE_OK ? insert.prepare(database, kInsert) : code;
    for (std::size_t i = 0; code == SQLITE_OK && i < jumps_.size(); ++i) {
        insert.bindFrom(1, jumps_[i].to, jumps_[i].seconds);
        code = insert.run();
    }
    return code;
}

} // namespace halyard::linux_
