// "Set the timeouts for Tarni Shell access (local and remote)": the shell's
// availability timeout and the idle timeout of its interactive sessions, in
// minutes. The values are read and written with the host's advanced-option
// tools; a new availability timeout restarts the running shell services so
// that it takes effect.
#pragma once

#include <string>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"

namespace Velk {

class ShellTimeoutDialog : public Dialog {
public:
    explicit ShellTimeoutDialog(Frame* parent);
    ~ShellTimeoutDialog() override;

    // false for Esc, true for Enter (whether or not anything changed).
    int Run() override;

private:
    // Construction: the option's value in whole minutes, -1 when it cannot
    // be read (any value entered is then written).
    static long ReadMinutes(const char* option);

    // Drawing.
    void Draw();

    // Keys.
    void HandleKey(int key);

    // Actions.
    bool Accept();
    // Writes minutes x 60 to the option with tarncli, else localcli; false
    // (logged) when neither could.
    static bool WriteMinutes(const char* option, long minutes);
    // Restarts each shell service that reports running.
    static void RestartRunningServices();

    long _availability;  // minutes, as read
    long _idle;          // minutes, as read
    InputItem* _availabilityField;
    InputItem* _idleField;
    ItemList* _list;
};

}  // namespace Velk
