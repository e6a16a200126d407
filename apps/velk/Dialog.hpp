// A centred, boxed dialog: a dark-grey title band with the title and a
// description, and a yellow body with an optional content window and a
// footer line of key hints.
#pragma once

#include <string>

#include "Frame.hpp"
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
    Window* _titleBand;
    Window* _body;
    Window* _content;  // null when the body is too small for one
    TextArea* _title;
    TextArea* _description;
    TextArea* _footer;
};

}  // namespace Velk
