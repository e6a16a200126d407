#include "TextArea.hpp"

#include <string_view>

#include "Console.hpp"
#include "DisplayWidth.hpp"

namespace Velk {

namespace {

constexpr size_t kNone = std::string::npos;
// How a literal "{" travels through the laid-out text.
constexpr std::string_view kLbraceTag = "{lbrace}";

bool StartsWith(std::string_view text, std::string_view prefix) {
    return text.substr(0, prefix.size()) == prefix;
}

bool IsColorTag(std::string_view tag) {
    return StartsWith(tag, "color:") || tag == "/color" || StartsWith(tag, "bgcolor:") || tag == "/bgcolor";
}

// Parses the N of "padding:N"; false unless N is a plain decimal number.
bool ParseCount(std::string_view digits, int& count) {
    if (digits.empty() || digits.size() > 6) return false;
    count = 0;
    for (char c : digits) {
        if (c < '0' || c > '9') return false;
        count = count * 10 + (c - '0');
    }
    return true;
}

// One layout pass over a mark-up text. Columns are screen columns (a wide
// character takes two, a combining one none); positions are byte offsets into
// the output. The text it shows is valid UTF-8: bytes that are not, and
// characters a terminal cannot show, come out as U+FFFD.
class Layouter {
public:
    explicit Layouter(int width) : _width(width), _left(width) {}

    void Run(std::string_view text, const std::function<bool(const std::string&, std::string&)>& lookup) {
        size_t i = 0;
        while (i < text.size()) {
            if (text[i] == '{') {
                const size_t close = text.find('}', i + 1);
                // An unterminated tag swallows the rest of the text.
                if (close == kNone) break;
                Tag(std::string(text.substr(i + 1, close - i - 1)), lookup);
                i = close + 1;
                continue;
            }
            const Glyph glyph = NextGlyph(text, i);
            Plain(glyph, false);
            i += glyph.length;
        }
    }

    std::string Result() { return std::move(_out); }

private:
    enum class Align { None, Right, Center, Padding };

    void Tag(const std::string& tag, const std::function<bool(const std::string&, std::string&)>& lookup) {
        if (tag.empty()) return;
        if (IsColorTag(tag)) {
            _out += '{' + tag + '}';
            _afterBase = false;
        } else if (tag == "lbrace") {
            Char("{", 1, false);
        } else if (tag == "/align") {
            EndAlign();
        } else if (StartsWith(tag, "align:")) {
            StartAlign(std::string_view(tag).substr(6));
        } else if (tag.find(':') == kNone) {
            std::string value;
            if (lookup && lookup(tag, value)) {
                for (size_t i = 0; i < value.size();) {
                    const Glyph glyph = NextGlyph(value, i);
                    Plain(glyph, true);
                    i += glyph.length;
                }
            }
        }
        // Any other tag takes no columns and leaves no trace.
    }

    void StartAlign(std::string_view how) {
        _alignStart = _out.size();
        _fieldFull = false;
        if (how == "right") {
            _mode = Align::Right;
        } else if (how == "center") {
            _mode = Align::Center;
        } else if (StartsWith(how, "padding:") && ParseCount(how.substr(8), _allowance)) {
            _mode = Align::Padding;
        } else {
            // "left" and anything unknown: the text simply follows on.
            _mode = Align::None;
        }
    }

    void EndAlign() {
        const int left = _left > 0 ? _left : 0;
        switch (_mode) {
            case Align::Right:
                InsertBlanks(_alignStart, left);
                break;
            case Align::Center:
                InsertBlanks(_alignStart, left / 2);
                break;
            case Align::Padding: {
                const int fill = _allowance < left ? _allowance : left;
                if (fill > 0) {
                    _out.append(static_cast<size_t>(fill), ' ');
                    _left -= fill;
                    _sinceBlank += fill;
                }
                break;
            }
            case Align::None:
                break;
        }
        _mode = Align::None;
    }

    // Shifts an aligned block right. The block is then fixed on its line: a
    // later overflow breaks after it rather than at a blank before it.
    void InsertBlanks(size_t at, int count) {
        if (count > 0) {
            _out.insert(at, static_cast<size_t>(count), ' ');
            _left -= count;
        }
        _lastBlank = kNone;
    }

    // A character of the text (fromValue false) or of a host value.
    void Plain(const Glyph& glyph, bool fromValue) {
        const char c = glyph.shown[0];
        if (c == '\n') {
            _out += '\n';
            LineStarted(_out.size() - 1);
            _left = _width;
            _afterBase = false;
            return;
        }
        if (c == '\t') {
            Char(" ", 1, fromValue);
        } else if (glyph.replaced || (static_cast<unsigned char>(c) >= 0x20 && c != 0x7f)) {
            Char(glyph.shown, glyph.columns, fromValue);
        }
        // Other control characters would upset the terminal: dropped.
    }

    void Char(std::string_view ch, int columns, bool fromValue) {
        // A character wider than the whole area could never be shown.
        if (columns > _width) {
            ch = kReplacementChar;
            columns = 1;
        }
        // A combining character is shown in the cell of the character right
        // before it. Without one (at the start of a line, after a colour tag
        // or a character cut off) it is dropped: the terminal would have no
        // cell to put it in.
        if (columns == 0) {
            // A cell holds a few combining characters at most.
            if (_afterBase && _marks < CCHARW_MAX - 1) {
                // A blank with a mark on it is no longer a place to break.
                if (_lastBlank != kNone && _lastBlank + 1 == _out.size()) _lastBlank = kNone;
                _out += ch;
                ++_marks;
            }
            return;
        }
        if (_mode == Align::Padding && (_fieldFull || _allowance < columns)) {
            // The field is full: the rest of its text is cut off, from a wide
            // character that would have fitted only half on; the columns
            // left are filled with blanks at its end.
            _fieldFull = true;
            _afterBase = false;
            return;
        }
        _afterBase = true;
        _marks = 0;
        const bool blank = ch == " ";
        if (_left < columns) {
            if (blank && !fromValue) {
                // A blank that meets a full line becomes the line break itself,
                // so the next line does not start with it.
                _out += '\n';
                LineStarted(_out.size() - 1);
                _left = _width;
                _afterBase = false;
                if (_mode == Align::Padding) --_allowance;
                return;
            }
            if (!fromValue && _lastBlank != kNone && _width - _sinceBlank >= columns) {
                _out[_lastBlank] = '\n';
                LineStarted(_lastBlank);
                _left = _width - _sinceBlank;
            } else {
                // No blank to break at, or a value: values are never wrapped as
                // words, a full line inside one breaks right there.
                _out += '\n';
                LineStarted(_out.size() - 1);
                _left = _width;
            }
        }
        if (ch == "{") {
            _out += kLbraceTag;
        } else {
            _out += ch;
        }
        _left -= columns;
        if (_mode == Align::Padding) _allowance -= columns;
        if (blank && !fromValue) {
            _lastBlank = _out.size() - 1;
            _sinceBlank = 0;
        } else {
            _sinceBlank += columns;
        }
    }

    // A line break now stands at position `at`. An alignment that began
    // before it applies to the new line only.
    void LineStarted(size_t at) {
        _lastBlank = kNone;
        if (_mode != Align::None && at >= _alignStart) _alignStart = at + 1;
    }

    std::string _out;
    const int _width;
    int _left;                  // columns left on the current line
    size_t _lastBlank = kNone;  // output position of the last blank on the line
    int _sinceBlank = 0;        // columns written since that blank
    size_t _alignStart = 0;
    Align _mode = Align::None;
    int _allowance = 0;       // padding: columns the aligned text may still take
    bool _fieldFull = false;  // padding: the aligned text was cut off
    bool _afterBase = false;  // the output ends in a shown character
    int _marks = 0;           // combining characters after it
};

}  // namespace

TextArea::TextArea(Window* parent, int x, int y, int width, int height, int color, const std::string& text)
    : Window(parent, x, y, width, height, -1, color),
      _text(text),
      _colors{{"white", WHITE},           {"black", BLACK},   {"dark-grey", DARK_GREY},
              {"light-grey", LIGHT_GREY}, {"yellow", YELLOW}, {"red", RED}},
      _values{{"ip", &TextArea::GetIpValue},
              {"ssl-thumbprint", &TextArea::GetSSLThumbprintValue},
              {"ssh-dsa-fingerprint", &TextArea::GetSSHDsaKeyFingerprintValue},
              {"ssh-rsa-fingerprint", &TextArea::GetSSHRsaKeyFingerprintValue},
              {"hostname", &TextArea::GetHostnameValue},
              {"tarnproduct", &TextArea::GetTarnProduct},
              {"tarnversion", &TextArea::GetTarnVersion},
              {"memory", &TextArea::GetSystemMemory},
              {"assettag", &TextArea::GetAssetTag},
              {"BIOSversion", &TextArea::GetBIOSVersion},
              {"BMCversion", &TextArea::GetBMCVersion},
              {"CPLDversion", &TextArea::GetCPLDVersion},
              {"PLSAversion", &TextArea::GetPLSAVersion}} {
    // An empty area is drawn when it is first shown; drawing it now would only
    // paint an uncoloured rectangle over whatever is on screen.
    if (!_text.empty()) Draw();
}

// The window is freed by Window's destructor.
TextArea::~TextArea() = default;

void TextArea::SetText(const std::string& text) {
    _text = text;
    Draw();
}

void TextArea::AppendText(const std::string& text) {
    _text += text;
    Draw();
}

void TextArea::Show(bool visible) {
    Window::Show(visible);
    Draw();
}

std::string TextArea::Layout(const std::string& text, int width,
                             const std::function<bool(const std::string&, std::string&)>& lookup) {
    Layouter layouter(width);
    layouter.Run(text, lookup);
    return layouter.Result();
}

std::string TextArea::Escape(const std::string& plain) {
    std::string out;
    out.reserve(plain.size());
    for (char c : plain) {
        if (c == '{') {
            out += kLbraceTag;
        } else {
            out += c;
        }
    }
    return out;
}

int TextArea::Columns(const std::string& plain) { return DisplayColumns(plain); }

void TextArea::Draw() {
    WINDOW* win = GetWindow();
    if (!win) return;
    werase(win);
    const std::string laidOut = Layout(_text, GetWidth(), [this](const std::string& key, std::string& value) {
        auto it = _values.find(key);
        if (it == _values.end()) return false;
        value = it->second();
        return true;
    });

    const bool visible = IsVisible();
    int bg = GetBg();
    int fg = GetFg();
    int line = 0;
    int column = 0;
    std::string run;
    auto drawRun = [&] {
        if (run.empty()) return;
        const attr_t attr = visible ? ColorAttr(bg, fg) : ColorAttr(BLACK, DARK_GREY);
        wattrset(win, static_cast<int>(attr));
        if (wmove(win, line, column) != ERR) AddShownText(win, run);
        column += Columns(run);
        run.clear();
    };
    auto colorNumber = [this](std::string_view name, int fallback) {
        auto it = _colors.find(std::string(name));
        return it == _colors.end() ? fallback : it->second;
    };

    for (size_t i = 0; i < laidOut.size();) {
        const char c = laidOut[i];
        if (c == '\n') {
            drawRun();
            // Text areas do not scroll: what does not fit is not shown.
            if (++line >= GetHeight()) break;
            column = 0;
            ++i;
            continue;
        }
        if (c != '{') {
            run += c;
            ++i;
            continue;
        }
        const size_t close = laidOut.find('}', i);
        if (close == kNone) break;
        const std::string_view tag = std::string_view(laidOut).substr(i + 1, close - i - 1);
        i = close + 1;
        if (tag == "lbrace") {
            run += '{';
            continue;
        }
        drawRun();
        if (StartsWith(tag, "color:")) {
            fg = colorNumber(tag.substr(6), fg);
        } else if (tag == "/color") {
            fg = GetFg();
        } else if (StartsWith(tag, "bgcolor:")) {
            bg = colorNumber(tag.substr(8), bg);
        } else if (tag == "/bgcolor") {
            bg = GetBg();
        }
    }
    if (line < GetHeight()) drawRun();
    wattrset(win, A_NORMAL);
    Refresh();
    // Refreshing leaves the terminal cursor after this text; put it back where
    // the screen placed it (an input field being edited).
    if (_cursor) {
        move(_yCursor, _xCursor);
        wnoutrefresh(stdscr);
    }
}

}  // namespace Velk
