// A notice: a title and a message, closed only by Enter.
#pragma once

#include <string>

#include "Dialog.hpp"

namespace Velk {

class MessageDialog : public Dialog {
public:
    MessageDialog(Frame* parent, int titleId, int messageId);
    MessageDialog(Frame* parent, int titleId, const std::string& message);

    int Run() override;

private:
    int _titleId;
    std::string _message;
};

}  // namespace Velk
