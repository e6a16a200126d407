// The host's main log files: which of them exist, the list shown in the menu,
// the digit keys that choose one, and paging through it with the host's pager.
#pragma once

#include <array>
#include <string>

namespace Velk {

class Frame;

class LogViewer {
public:
    static constexpr int LOG_COUNT = 7;

    struct Log {
        const char* label;
        const char* path;  // host path
        bool available;
    };

    LogViewer();

    // Checks which logs exist and returns the menu text: one numbered line per
    // existing log, then how to choose one.
    std::string Listing();

    // The row a digit key opens, or -1 when the key does nothing. Digits
    // 1..count open the listed logs in their order; any other digit opens the
    // row whose index is the number of listed logs, unless more than six are
    // listed. That row may be missing: the pager then says so.
    static int ChooseLog(const std::array<bool, LOG_COUNT>& available, int digit);
    // The same for the availability found by the last Listing().
    int ChooseLog(int digit) const;

    // Hands the terminal to the pager on the row's log, waits for it and gives
    // the screen back to owner (hidden and shown again, made foreground).
    void ViewLog(int row, Frame* owner);

    const Log& GetLog(int row) const { return _logs[static_cast<size_t>(row)]; }

private:
    std::array<Log, LOG_COUNT> _logs;
};

}  // namespace Velk
