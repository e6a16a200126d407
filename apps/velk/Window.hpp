// A rectangle of the screen backed by a curses window, with colours, an
// optional parent and owned child windows.
#pragma once

#include <curses.h>

#include <string>
#include <vector>

namespace Velk {

class Window {
public:
    // Top-level window.
    Window(int x, int y, int width, int height, int bg, int fg);
    // Child window; x and y are relative to the parent. A colour of -1 takes
    // the parent's.
    Window(Window* parent, int x, int y, int width, int height, int bg, int fg);
    virtual ~Window();
    Window(const Window&) = delete;
    Window& operator=(const Window&) = delete;

    // Visible windows are drawn in their colours, hidden ones dimmed (dark grey
    // on black). Applies to every child, then refreshes. Drops type-ahead,
    // except while _keepTypeAhead is set.
    virtual void Show(bool visible);

    static Window* NewChild(Window* parent, int x, int y, int width, int height, int bg, int fg);

    void SetColors(int bg, int fg);
    // Writes text at x, y, cut to the columns left on the row.
    void Print(int x, int y, const std::string& text);
    void MoveCursor(int x, int y);
    static void SetCursor(bool on);
    // Copies the window to the next screen update. The terminal is written
    // once per update, at Flush, so a key that redraws several windows sends
    // only the cells that end up different (a serial line pays per byte).
    void Refresh();
    // Writes pending changes to the terminal. Reading a key does it, and so
    // does starting a child program; call it before any other slow step, so
    // that the screen shows what the console is waiting for.
    static void Flush();
    void Redraw();
    void Erase();
    void Box();

    WINDOW* GetWindow() const { return _win; }
    int GetX() const { return _x; }
    int GetY() const { return _y; }
    int GetWidth() const { return _width; }
    int GetHeight() const { return _height; }
    int GetBg() const { return _bg; }
    int GetFg() const { return _fg; }
    bool IsVisible() const { return _visible; }
    Window* GetParent() const { return _parent; }

    static int _xCursor;
    static int _yCursor;
    static bool _cursor;
    // Set while a screen is drawn again as it is (a refresh): keys typed
    // meanwhile are meant for that same screen.
    static bool _keepTypeAhead;

private:
    void ApplyBackground(int bg, int fg);

    bool _savedCursor = false;
    int _savedX = 0;
    int _savedY = 0;
    Window* _parent = nullptr;
    WINDOW* _win = nullptr;
    int _x = 0;
    int _y = 0;
    int _width = 0;
    int _height = 0;
    int _bg = 0;
    int _fg = 7;
    std::vector<Window*> _children;
    bool _visible = true;
};

}  // namespace Velk
