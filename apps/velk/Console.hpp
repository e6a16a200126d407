// Process-wide state of the console and the start-up helpers that set up the
// terminal: colours, the key table and the virtual-terminal switch.
#pragma once

#include <curses.h>
#include <termios.h>

#include <string>

// false when the terminal is the local console (TERM is "linux").
extern bool runningOverSerial;
// Black/white mode: the terminal cannot redefine colours, no pairs exist.
extern bool bwColor;
// Terminal settings of standard output as found at start.
extern struct termios orig_termios;

namespace Velk {

// PAM service name of console logins.
extern const char* const VELK_APP;
// Account under which host-agent commands run when the logged-in user can't.
extern const char* const VELK_USER;
// Advanced option holding the console idle timeout in seconds.
extern const std::string VELK_TIMEOUT_VAR;

// Colour numbers used throughout the console.
enum Color { BLACK = 0, RED = 1, LIGHT_GREY = 2, YELLOW = 3, DARK_GREY = 6, WHITE = 7 };

void InitColors();
// The curses attribute for a background/foreground pair.
attr_t ColorAttr(int bg, int fg);
// Registers the escape-sequence key table with curses.
void DefineKeys();
// Activates virtual terminal vt through "/dev/console"; failures are ignored.
void SwitchToVt(int vt);
// Logs "<what> with errno(N): <text>" at LOG_ERR.
void LogError(const char* what);

// Why the console cannot run on this terminal, or "" when it can: standard
// input or output is not a terminal, TERM is unset or unknown, or the
// terminal type cannot place the cursor (such as "dumb").
std::string TerminalProblem();
// Ctrl-S and Ctrl-Q are ordinary (ignored) keys: a stray Ctrl-S must never
// freeze the console, and its output is small enough not to need pacing.
void DisableFlowControl();

// The smallest terminal on which every screen and dialog fits.
inline constexpr int kMinColumns = 78;
inline constexpr int kMinLines = 23;

}  // namespace Velk
