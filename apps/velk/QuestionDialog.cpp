#include "QuestionDialog.hpp"

#include "StringFactory.hpp"

namespace Velk {

QuestionDialog::QuestionDialog(Frame* parent, int titleId, int descriptionId, int questionId)
    : Dialog(parent, 70, 12, 7), _titleId(titleId), _descriptionId(descriptionId), _questionId(questionId) {
    _question = new TextArea(_content, 0, 0, _content->GetWidth(), _content->GetHeight(), BLACK);
}

int QuestionDialog::Run() {
    SetTitle(_factory->GetString(_titleId));
    SetDescription(_factory->GetString(_descriptionId));
    _question->SetText(_factory->GetString(_questionId));
    SetFooter(
        "{align:right}{color:black}<Enter>{/color} {color:dark-grey}OK{/color}  {color:black}<Esc>{/color} "
        "{color:dark-grey}Cancel{/color}{/align}");
    Refresh();
    for (;;) {
        const int key = GetKey(true);
        if (key == '\n') return true;
        if (key == 27) return false;
    }
}

}  // namespace Velk
