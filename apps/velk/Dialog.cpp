#include "Dialog.hpp"

#include "Console.hpp"

namespace Velk {

Dialog::Dialog(Frame* parent, int width, int height, int headerHeight)
    : Frame(parent, (COLS - width) / 2, (LINES - height) / 2, width, height, BLACK, WHITE) {
    Erase();
    Box();
    _titleBand = NewChild(this, 0, 0, width, headerHeight, DARK_GREY, WHITE);
    _body = NewChild(this, 0, headerHeight, width, height - headerHeight, YELLOW, WHITE);
    const int bandWidth = _titleBand->GetWidth();
    _title = new TextArea(_titleBand, 3, 1, bandWidth - 6, 1, WHITE);
    _description = new TextArea(_titleBand, 3, 3, bandWidth - 6, headerHeight - 4, LIGHT_GREY);
    const int bodyWidth = _body->GetWidth();
    const int bodyHeight = _body->GetHeight();
    _footer = new TextArea(_body, 2, bodyHeight - 2, bodyWidth - 4, 1, BLACK);
    _content = bodyHeight - 4 < 1 ? nullptr
                                  : NewChild(_body, 2, 1, bodyWidth - 4, bodyHeight - 4, YELLOW, DARK_GREY);
}

// The child windows and text areas belong to the window tree and are freed
// by the window destructor.
Dialog::~Dialog() = default;

void Dialog::Show(bool visible) {
    if (visible && _parent) _parent->Refresh();
    Frame::Show(visible);
}

void Dialog::SetTitle(const std::string& text) { _title->SetText(text); }
void Dialog::SetDescription(const std::string& text) { _description->SetText(text); }
void Dialog::SetFooter(const std::string& text) { _footer->SetText(text); }

bool Dialog::WaitForF11() {
    for (;;) {
        const int key = GetKey(true);
        if (key == 27) return false;
        if (key == KEY_F(11)) return true;
    }
}

int Dialog::RunForm(const std::function<void()>& draw, const std::function<bool()>& accept,
                    const std::function<void(int)>& onKey) {
    draw();
    for (;;) {
        const int key = GetKey(true);
        if (key == 27 || (key == '\n' && accept())) {
            SetCursor(false);
            return key == '\n';
        }
        if (key == '\n')
            draw();
        else
            onKey(key);
    }
}

int Dialog::RunList(ItemList* list, const std::function<void()>& toggle,
                    const std::function<std::optional<int>()>& accept) {
    for (;;) {
        switch (GetKey(true)) {
            case KEY_UP:
                list->Up();
                break;
            case KEY_DOWN:
                list->Down();
                break;
            case ' ':
                toggle();
                break;
            case '\n':
                if (const std::optional<int> result = accept()) return *result;
                break;
            case 27:
                return 0;
            default:
                break;
        }
    }
}

ItemList* Dialog::NewContentList(const std::vector<Item*>& items) {
    auto* list = new ItemList(_content, 0, 0, _content->GetWidth(), _content->GetHeight());
    list->SetItems(items);
    return list;
}

}  // namespace Velk
