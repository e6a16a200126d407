// What the two timeout dialogs share: the keys a minutes field takes, how
// its text is read, and the message for a value out of range.
#pragma once

#include <string>

namespace Velk {

class Frame;

// The largest timeout in minutes (a day); 0 disables a timeout.
constexpr long MAX_TIMEOUT_MINUTES = 1440;
// Characters a minutes field holds.
constexpr int TIMEOUT_FIELD_LENGTH = 5;

// Footer of both timeout dialogs.
constexpr const char* TIMEOUT_FOOTER =
    "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
    "{color:dark-grey}Cancel{/color}{/align}";

struct TimeoutEntry {
    enum Kind {
        Empty,    // no change wanted
        Invalid,  // above the maximum, or not a number at all
        Minutes,  // 0 to MAX_TIMEOUT_MINUTES, in `minutes`
    };
    Kind kind = Empty;
    long minutes = 0;
};

// Reads a field's text as a whole decimal number of minutes.
TimeoutEntry ReadTimeoutField(const std::string& text);

// Digits and the editing keys; every other key (signs, letters) is ignored.
bool IsTimeoutFieldKey(int key);

// The "Invalid timeout value" message, closed with Enter.
void ShowInvalidTimeout(Frame* parent);

}  // namespace Velk
