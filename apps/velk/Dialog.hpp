// A centred, boxed dialog: a dark-grey title band with the title and a
// description, and a yellow body with an optional content window and a
// footer line of key hints.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "Frame.hpp"
#include "Item.hpp"
#include "ItemList.hpp"
#include "TextArea.hpp"

namespace Velk {

class Dialog : public Frame {
public:
    Dialog(Frame* parent, int width, int height, int headerHeight);
    ~Dialog() override;

    void Show(bool visible) override;

    void SetTitle(const std::string& text);
    void SetDescription(const std::string& text);
    void SetFooter(const std::string& text);

protected:
    // Footer of a dialog whose list rows are marked with Space.
    static constexpr const char* TOGGLE_LIST_FOOTER =
        "{color:black}<Up/Down>{/color} {color:dark-grey}Select{/color}  {color:black}<Space>{/color} "
        "{color:dark-grey}Toggle Selected{/color}{align:right}{color:black}<Enter>{/color} "
        "{color:dark-grey}OK{/color}  {color:black}<Esc>{/color} {color:dark-grey}Cancel{/color}{/align}";

    // Footer of a dialog whose radio rows are marked with Space.
    static constexpr const char* MARK_LIST_FOOTER =
        "{color:black}<Up/Down>{/color} {color:dark-grey}Select{/color}  {color:black}<Space>{/color} "
        "{color:dark-grey}Mark Selected{/color}{align:right}{color:black}<Enter>{/color} "
        "{color:dark-grey}OK{/color}  {color:black}<Esc>{/color} {color:dark-grey}Cancel{/color}{/align}";

    // Waits for the key of a destructive action: true for F11, false for Esc;
    // every other key (Enter included) is ignored.
    bool WaitForF11();

    // The key loop of a form: Esc ends it with false, Enter with true once
    // `accept` agrees (after a refusal `draw` shows the dialog again), and
    // every other key goes to `onKey`. `draw` also draws the dialog first.
    // The text cursor is hidden when the loop ends.
    int RunForm(const std::function<void()>& draw, const std::function<bool()>& accept,
                const std::function<void(int)>& onKey);

    // The key loop of a list dialog: Up and Down move `list`'s bar, Space
    // calls `toggle`, Enter ends the loop with what `accept` returns (when it
    // returns a value) and Esc with 0; other keys are ignored.
    int RunList(ItemList* list, const std::function<void()>& toggle,
                const std::function<std::optional<int>()>& accept);

    // A list filling the content window, showing `items` (still owned by
    // the caller); the caller deletes the list.
    ItemList* NewContentList(const std::vector<Item*>& items);

    Window* _titleBand;
    Window* _body;
    Window* _content;  // null when the body is too small for one
    TextArea* _title;
    TextArea* _description;
    TextArea* _footer;
};

}  // namespace Velk
