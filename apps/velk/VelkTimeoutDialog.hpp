// "Set idle timeout for VELK access": the console's own idle timeout in
// minutes, one field. A changed value is written to the host's advanced
// option and takes effect at once.
#pragma once

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"

namespace Velk {

class VelkTimeoutDialog : public Dialog {
public:
    explicit VelkTimeoutDialog(Frame* parent);
    ~VelkTimeoutDialog() override;

    // false for Esc, true for Enter (whether or not anything changed).
    int Run() override;

    // The console idle timeout in seconds as the host holds it: 600 when the
    // option is missing, holds no integer or cannot be read.
    static long ReadIdleTimeout();

private:
    void Draw();
    // Writes the field's value when it is valid and differs from the
    // current one; the dialog ends in every case.
    bool Accept();
    // Writes `seconds` to the option; false (logged) when it cannot be.
    bool WriteIdleTimeout(long seconds);

    long _current;  // seconds
    InputItem* _field;
    ItemList* _list;
};

}  // namespace Velk
