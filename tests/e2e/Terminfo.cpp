// Terminfo look-ups for Terminal, kept apart because <term.h> defines macros
// with everyday names (lines, columns, ...).
#include <fcntl.h>
#include <unistd.h>

#include <mutex>

#include "Terminal.hpp"
// clang-format off
#include <curses.h>
#include <term.h>
// clang-format on

namespace E2e {

std::string Terminal::TerminfoString(const std::string& term, const std::string& capname) {
    static std::mutex mutex;
    std::lock_guard lock(mutex);
    TERMINAL* saved = cur_term;
    int fd = open("/dev/null", O_WRONLY | O_CLOEXEC);
    int err = 0;
    std::string result;
    if (setupterm(term.c_str(), fd, &err) == OK) {
        const char* value = tigetstr(capname.c_str());
        if (value != nullptr && value != reinterpret_cast<const char*>(-1)) result = value;
        del_curterm(cur_term);
    }
    set_curterm(saved);
    if (fd >= 0) close(fd);
    return result;
}

}  // namespace E2e
