#include "Window.hpp"

#include <algorithm>

#include "Console.hpp"
#include "DisplayWidth.hpp"

namespace Velk {

int Window::_xCursor = 0;
int Window::_yCursor = 0;
bool Window::_cursor = false;
bool Window::_keepTypeAhead = false;

Window::Window(int x, int y, int width, int height, int bg, int fg)
    : _win(newwin(height, width, y, x)), _x(x), _y(y), _width(width), _height(height), _bg(bg), _fg(fg) {}

Window::Window(Window* parent, int x, int y, int width, int height, int bg, int fg)
    : _parent(parent),
      _x(parent->_x + x),
      _y(parent->_y + y),
      _width(width),
      _height(height),
      _bg(bg == -1 ? parent->_bg : bg),
      _fg(fg == -1 ? parent->_fg : fg) {
    _win = subwin(parent->_win, height, width, _y, _x);
    parent->_children.push_back(this);
}

Window::~Window() {
    if (_parent) {
        auto& siblings = _parent->_children;
        siblings.erase(std::remove(siblings.begin(), siblings.end(), this), siblings.end());
    }
    while (!_children.empty()) delete _children.back();
    if (_win) delwin(_win);
}

Window* Window::NewChild(Window* parent, int x, int y, int width, int height, int bg, int fg) {
    return new Window(parent, x, y, width, height, bg, fg);
}

void Window::ApplyBackground(int bg, int fg) {
    if (_win) wbkgd(_win, ColorAttr(bg, fg) | ' ');
}

void Window::Show(bool visible) {
    _visible = visible;
    if (visible) {
        ApplyBackground(_bg, _fg);
    } else {
        if (!_parent) {
            _savedCursor = _cursor;
            _savedX = _xCursor;
            _savedY = _yCursor;
            SetCursor(false);
        }
        ApplyBackground(BLACK, DARK_GREY);
    }
    for (Window* child : std::vector<Window*>(_children)) child->Show(visible);
    Refresh();
    if (visible && !_parent) {
        _cursor = _savedCursor;
        _xCursor = _savedX;
        _yCursor = _savedY;
        curs_set(_cursor ? 1 : 0);
        if (_cursor) move(_yCursor, _xCursor);
    }
    if (!_keepTypeAhead) flushinp();
}

void Window::SetColors(int bg, int fg) {
    _bg = bg == -1 && _parent ? _parent->_bg : bg;
    _fg = fg == -1 && _parent ? _parent->_fg : fg;
    if (_visible) {
        ApplyBackground(_bg, _fg);
        for (Window* child : _children) child->SetColors(bg, fg);
    }
}

void Window::Print(int x, int y, const std::string& text) {
    // Only what fits on the row is written: curses would carry the rest over
    // to the next row, or across the frame's border.
    if (_win && wmove(_win, y, x) != ERR) waddnstr(_win, CutToColumns(text, _width - x).c_str(), -1);
}

void Window::MoveCursor(int x, int y) {
    _xCursor = x + _x;
    _yCursor = y + _y;
    move(_yCursor, _xCursor);
}

void Window::SetCursor(bool on) {
    _cursor = on;
    curs_set(on ? 1 : 0);
}

void Window::Refresh() {
    if (!_win) return;
    wtouchln(_win, 0, _height, 1);
    wnoutrefresh(_win);
}

void Window::Flush() {
    // Nothing to write before curses starts or while the terminal is handed
    // to another program.
    if (stdscr == nullptr || isendwin()) return;
    // A hidden cursor stays where the last change ended: taking it home
    // after every update would cost bytes for nothing.
    leaveok(newscr, !_cursor);
    doupdate();
}

void Window::Redraw() {
    if (_win) wredrawln(_win, 0, _height);
    for (Window* child : _children) child->Redraw();
}

void Window::Erase() {
    if (_win) werase(_win);
}

void Window::Box() {
    if (_win) box(_win, 0, 0);
}

}  // namespace Velk
