#include "TextArea.hpp"

#include <string_view>

#include "Console.hpp"

namespace Velk {

namespace {

constexpr size_t kNone = std::string::npos;
// How a literal "{" travels through the laid-out text.
constexpr std::string_view kLbraceTag = "{lbrace}";

bool IsContinuationByte(char c) { return (static_cast<unsigned char>(c) & 0xC0) == 0x80; }

// Bytes of the UTF-8 character that starts at text[i]. A malformed or cut
// sequence counts as a character of the bytes that do continue it.
size_t CharLength(std::string_view text, size_t i) {
    const unsigned char lead = static_cast<unsigned char>(text[i]);
    size_t expected = 1;
    if ((lead & 0xE0) == 0xC0) {
        expected = 2;
    } else if ((lead & 0xF0) == 0xE0) {
        expected = 3;
    } else if ((lead & 0xF8) == 0xF0) {
        expected = 4;
    }
    size_t length = 1;
    while (length < expected && i + length < text.size() && IsContinuationByte(text[i + length])) ++length;
    return length;
}

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

// One layout pass over a mark-up text. Columns are counted per character;
// positions are byte offsets into the output.
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
            const size_t length = CharLength(text, i);
            Plain(text.substr(i, length), false);
            i += length;
        }
    }

    std::string Result() { return std::move(_out); }

private:
    enum class Align { None, Right, Center, Padding };

    void Tag(const std::string& tag, const std::function<bool(const std::string&, std::string&)>& lookup) {
        if (tag.empty()) return;
        if (IsColorTag(tag)) {
            _out += '{' + tag + '}';
        } else if (tag == "lbrace") {
            Char("{", false);
        } else if (tag == "/align") {
            EndAlign();
        } else if (StartsWith(tag, "align:")) {
            StartAlign(std::string_view(tag).substr(6));
        } else if (tag.find(':') == kNone) {
            std::string value;
            if (lookup && lookup(tag, value)) {
                for (size_t i = 0; i < value.size();) {
                    const size_t length = CharLength(value, i);
                    Plain(std::string_view(value).substr(i, length), true);
                    i += length;
                }
            }
        }
        // Any other tag takes no columns and leaves no trace.
    }

    void StartAlign(std::string_view how) {
        _alignStart = _out.size();
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
    void Plain(std::string_view ch, bool fromValue) {
        const char c = ch[0];
        if (c == '\n') {
            _out += '\n';
            LineStarted(_out.size() - 1);
            _left = _width;
            return;
        }
        if (c == '\t') {
            Char(" ", fromValue);
        } else if (static_cast<unsigned char>(c) >= 0x20 && c != 0x7f) {
            Char(ch, fromValue);
        }
        // Other control characters would upset the terminal: dropped.
    }

    void Char(std::string_view ch, bool fromValue) {
        if (_mode == Align::Padding && _allowance <= 0) return;
        const bool blank = ch == " ";
        if (_left <= 0) {
            if (blank && !fromValue) {
                // A blank that meets a full line becomes the line break itself,
                // so the next line does not start with it.
                _out += '\n';
                LineStarted(_out.size() - 1);
                _left = _width;
                if (_mode == Align::Padding) --_allowance;
                return;
            }
            if (!fromValue && _lastBlank != kNone) {
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
        --_left;
        if (_mode == Align::Padding) --_allowance;
        if (blank && !fromValue) {
            _lastBlank = _out.size() - 1;
            _sinceBlank = 0;
        } else {
            ++_sinceBlank;
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
    int _allowance = 0;  // padding: columns the aligned text may still take
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

int TextArea::Columns(const std::string& plain) {
    int columns = 0;
    for (char c : plain) {
        if (!IsContinuationByte(c)) ++columns;
    }
    return columns;
}

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
        if (wmove(win, line, column) != ERR) waddnstr(win, run.c_str(), -1);
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
