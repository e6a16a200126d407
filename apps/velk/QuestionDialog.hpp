// A warning that asks before going on: a title, what the matter is, and the
// question. Enter goes on, Esc goes back ("Network Adapters: Warning" about
// NICs that serve other connections, "kDS Uplinks: Warning" about a port
// without chosen uplinks).
#pragma once

#include "Dialog.hpp"
#include "TextArea.hpp"

namespace Velk {

class QuestionDialog : public Dialog {
public:
    // Text ids of the title, the description and the question.
    QuestionDialog(Frame* parent, int titleId, int descriptionId, int questionId);

    // true for Enter, false for Esc.
    int Run() override;

private:
    int _titleId;
    int _descriptionId;
    int _questionId;
    TextArea* _question;  // owned by the window tree
};

}  // namespace Velk
