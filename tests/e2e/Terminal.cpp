#include "Terminal.hpp"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <pty.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vterm.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <regex>
#include <stdexcept>

namespace E2e {

namespace {

using Clock = std::chrono::steady_clock;

int HexDigit(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

void AppendUtf8(std::string& out, uint32_t cp) {
    static constexpr uint8_t kLead[] = {0x00, 0xC0, 0xE0, 0xF0};
    const int more = cp < 0x80 ? 0 : cp < 0x800 ? 1 : cp < 0x10000 ? 2 : 3;  // continuation bytes
    out += char(kLead[more] | (cp >> (6 * more)));
    for (int i = more - 1; i >= 0; --i) out += char(0x80 | ((cp >> (6 * i)) & 0x3F));
}

CellColor ToCellColor(const VTermColor& c, bool foreground) {
    CellColor color;
    if (foreground ? VTERM_COLOR_IS_DEFAULT_FG(&c) : VTERM_COLOR_IS_DEFAULT_BG(&c)) return color;
    if (VTERM_COLOR_IS_INDEXED(&c)) {
        color.kind = CellColor::Kind::Indexed;
        color.index = c.indexed.idx;
    } else {
        color.kind = CellColor::Kind::Direct;
        color.rgb = {c.rgb.red, c.rgb.green, c.rgb.blue};
    }
    return color;
}

// One character per cell for the colour lines of a dump.
char ColorChar(const CellColor& c) {
    switch (c.kind) {
        case CellColor::Kind::Default:
            return '.';
        case CellColor::Kind::Indexed:
            return c.index < 16 ? "0123456789abcdef"[c.index] : '+';
        case CellColor::Kind::Direct:
            return '#';
    }
    return '?';
}

// Writes all of `bytes` to `fd`; false on an error.
bool WriteAll(int fd, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t n = write(fd, bytes.data(), bytes.size());
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        bytes.remove_prefix(size_t(n));
    }
    return true;
}

std::string Trim(const std::string& s) {
    size_t b = s.find_first_not_of(' ');
    if (b == std::string::npos) return {};
    size_t e = s.find_last_not_of(' ');
    return s.substr(b, e - b + 1);
}

}  // namespace

std::string ToString(const Rgb& rgb) {
    char buf[16];
    snprintf(buf, sizeof buf, "#%02x%02x%02x", rgb.r, rgb.g, rgb.b);
    return buf;
}

std::string ToString(const CellColor& color) {
    switch (color.kind) {
        case CellColor::Kind::Default:
            return "default";
        case CellColor::Kind::Indexed:
            return "index " + std::to_string(color.index);
        case CellColor::Kind::Direct:
            return ToString(color.rgb);
    }
    return "?";
}

std::string LinuxPaletteFilter::Feed(std::string_view bytes, std::vector<PaletteChange>& changes) {
    const std::string in = _held + std::string(bytes);
    _held.clear();
    std::string out;
    for (size_t i = 0; i < in.size();) {
        const size_t esc = in.find('\x1b', i);
        out.append(in, i, esc - i);
        if (esc == std::string::npos) break;
        const std::string_view rest = std::string_view(in).substr(esc);
        // Incomplete prefixes of the two sequences wait for the next read.
        if (rest.size() < 3 ? std::string_view("\x1b]").starts_with(rest)
                            : rest.starts_with("\x1b]P") && rest.size() < 10) {
            _held = rest;
            break;
        }
        int d[7];
        bool hex = rest.starts_with("\x1b]P");
        for (size_t k = 0; k < 7 && hex; ++k) hex = (d[k] = HexDigit(rest[3 + k])) >= 0;
        if (rest.starts_with("\x1b]R")) {
            changes.push_back({-1, {}});
            i = esc + 3;
        } else if (hex) {
            changes.push_back(
                {d[0], {uint8_t(d[1] * 16 + d[2]), uint8_t(d[3] * 16 + d[4]), uint8_t(d[5] * 16 + d[6])}});
            i = esc + 10;
        } else {
            out += '\x1b';
            i = esc + 1;
        }
    }
    return out;
}

bool ParsePaletteOsc(std::string_view body, std::vector<PaletteChange>& changes) {
    static const std::string kPair =
        ";(\\d{1,5});rgb:([0-9a-fA-F]{1,4})/([0-9a-fA-F]{1,4})/([0-9a-fA-F]{1,4})";
    static const std::regex whole("4(" + kPair + ")+"), pair(kPair);
    const std::string text(body);
    if (!std::regex_match(text, whole)) return false;
    for (std::sregex_iterator it(text.begin(), text.end(), pair), end; it != end; ++it) {
        uint8_t rgb[3];
        for (size_t k = 0; k < 3; ++k) {
            // 1 to 4 hex digits scaled to 8 bits.
            const std::string comp = (*it)[k + 2];
            const unsigned long max = (1ul << (4 * comp.size())) - 1;
            rgb[k] = uint8_t((std::stoul(comp, nullptr, 16) * 255 + max / 2) / max);
        }
        changes.push_back({std::stoi((*it)[1]), {rgb[0], rgb[1], rgb[2]}});
    }
    return true;
}

Terminal::Terminal(TerminalOptions options)
    : _options(std::move(options)), _cols(_options.cols), _rows(_options.rows) {
    _vt = vterm_new(_rows, _cols);
    vterm_set_utf8(_vt, 1);
    vterm_output_set_callback(_vt, &Terminal::OnOutput, this);
    _screen = vterm_obtain_screen(_vt);
    vterm_screen_enable_altscreen(_screen, 1);
    vterm_screen_reset(_screen, 1);
    static const VTermParserCallbacks fallbacks = {.osc = &Terminal::OnOsc};
    vterm_screen_set_unrecognised_fallbacks(_screen, &fallbacks, this);

    // Everything the child needs is built before the fork.
    std::vector<std::string> envStrings{"TERM=" + _options.term};
    envStrings.insert(envStrings.end(), _options.env.begin(), _options.env.end());
    std::vector<char*> envp;
    for (auto& e : envStrings) envp.push_back(e.data());
    envp.push_back(nullptr);
    std::vector<char*> argv{_options.program.data()};
    for (auto& a : _options.args) argv.push_back(a.data());
    argv.push_back(nullptr);

    struct winsize ws = {};
    ws.ws_row = static_cast<unsigned short>(_rows);
    ws.ws_col = static_cast<unsigned short>(_cols);
    _lastOutput = Clock::now();
    _pid = forkpty(&_master, nullptr, nullptr, &ws);
    if (_pid < 0) {
        vterm_free(_vt);
        throw std::runtime_error(std::string("forkpty failed: ") + strerror(errno));
    }
    if (_pid == 0) {
        sigset_t none;
        sigemptyset(&none);
        sigprocmask(SIG_SETMASK, &none, nullptr);
        signal(SIGPIPE, SIG_DFL);
        execve(argv[0], argv.data(), envp.data());
        _exit(127);
    }
    fcntl(_master, F_SETFD, FD_CLOEXEC);
    _reader = std::thread([this] { ReaderLoop(); });
}

Terminal::~Terminal() {
    if (!_status) {
        // The program is a session leader: its group holds whatever it started.
        kill(-_pid, SIGKILL);
        kill(_pid, SIGKILL);
        Reap(0);
    }
    HangUp();
    vterm_free(_vt);
}

void Terminal::HangUp() {
    {
        std::lock_guard lock(_mutex);
        if (_master < 0) return;
        _stop = true;
    }
    _reader.join();
    std::lock_guard lock(_mutex);
    close(_master);
    _master = -1;
    _eof = true;
    _changed.notify_all();
}

void Terminal::ReaderLoop() {
    char buf[65536];
    for (;;) {
        {
            std::lock_guard lock(_mutex);
            if (_stop) return;
        }
        struct pollfd p = {_master, POLLIN, 0};
        int r = poll(&p, 1, 20);
        if (r <= 0) continue;
        ssize_t n = read(_master, buf, sizeof buf);
        if (n < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        std::lock_guard lock(_mutex);
        if (n > 0) {
            _output.append(buf, size_t(n));
            _lastOutput = Clock::now();
            const std::string pass = _filter.Feed(std::string_view(buf, size_t(n)), _palette);
            vterm_input_write(_vt, pass.data(), pass.size());
        } else {
            // EIO: every holder of the slave side has closed it.
            _eof = true;
        }
        _changed.notify_all();
        if (_eof) return;
    }
}

void Terminal::OnOutput(const char* bytes, size_t len, void* user) {
    // Answers of the emulated terminal (cursor reports and the like).
    WriteAll(static_cast<Terminal*>(user)->_master, std::string_view(bytes, len));
}

int Terminal::OnOsc(const char* command, size_t len, void* user) {
    auto* self = static_cast<Terminal*>(user);
    return ParsePaletteOsc(std::string_view(command, len), self->_palette) ? 1 : 0;
}

int Terminal::Cols() const {
    std::lock_guard lock(_mutex);
    return _cols;
}

int Terminal::Rows() const {
    std::lock_guard lock(_mutex);
    return _rows;
}

void Terminal::Send(std::string_view bytes) {
    if (!WriteAll(_master, bytes)) ADD_FAILURE() << "writing to the terminal failed: " << strerror(errno);
}

void Terminal::SendKey(std::string_view name) {
    static const std::map<std::string, std::string, std::less<>> literal = {
        {"Enter", "\r"}, {"Esc", "\x1b"}, {"Tab", "\t"}};
    static const std::map<std::string, std::string, std::less<>> capability = {
        {"Up", "kcuu1"},     {"Down", "kcud1"},   {"Left", "kcub1"},   {"Right", "kcuf1"},
        {"Home", "khome"},   {"End", "kend"},     {"PageUp", "kpp"},   {"PageDown", "knp"},
        {"Insert", "kich1"}, {"Delete", "kdch1"}, {"Backspace", "kbs"}};
    if (auto it = literal.find(name); it != literal.end()) return Send(it->second);
    std::string cap;
    if (auto it = capability.find(name); it != capability.end()) {
        cap = it->second;
    } else if (name.size() >= 2 && name[0] == 'F') {
        cap = "kf" + std::string(name.substr(1));
    } else {
        ADD_FAILURE() << "unknown key name " << name;
        return;
    }
    std::string bytes = TerminfoString(_options.term, cap);
    if (bytes.empty()) {
        ADD_FAILURE() << "TERM=" << _options.term << " has no key " << name << " (" << cap << ")";
        return;
    }
    Send(bytes);
}

void Terminal::Signal(int sig) {
    if (kill(_pid, sig) != 0) ADD_FAILURE() << "kill(" << _pid << ", " << sig << "): " << strerror(errno);
}

void Terminal::Resize(int cols, int rows) {
    {
        std::lock_guard lock(_mutex);
        vterm_set_size(_vt, rows, cols);
        _cols = cols;
        _rows = rows;
    }
    struct winsize ws = {};
    ws.ws_row = static_cast<unsigned short>(rows);
    ws.ws_col = static_cast<unsigned short>(cols);
    if (ioctl(_master, TIOCSWINSZ, &ws) != 0) ADD_FAILURE() << "TIOCSWINSZ: " << strerror(errno);
}

struct termios Terminal::Modes() const {
    struct termios modes = {};
    if (tcgetattr(_master, &modes) != 0) ADD_FAILURE() << "tcgetattr: " << strerror(errno);
    return modes;
}

::testing::AssertionResult Terminal::WaitFor(std::string_view text, bool shown, Duration timeout) {
    const auto deadline = Clock::now() + timeout;
    {
        std::unique_lock lock(_mutex);
        auto done = [&] { return FindLocked(text, 1).empty() != shown; };
        _changed.wait_until(lock, deadline, [&] { return _eof || done(); });
        if (!done()) {
            return ::testing::AssertionFailure()
                   << "\"" << text << (shown ? "\" not on the screen" : "\" still on the screen")
                   << (_eof ? " (the program closed the terminal)"
                            : " after " + std::to_string(timeout.count()) + " ms")
                   << "\n"
                   << DumpLocked(false);
        }
    }
    return WaitQuiet(kQuiet, timeout);
}

::testing::AssertionResult Terminal::WaitQuiet(Duration quiet, Duration timeout) {
    const auto start = Clock::now();
    const auto deadline = start + timeout;
    std::unique_lock lock(_mutex);
    for (;;) {
        const auto now = Clock::now();
        // The quiet period starts now at the earliest: a check that nothing
        // happens after an action always gives the program that long.
        const auto quietUntil = std::max(_lastOutput, start) + quiet;
        if (_eof || now >= quietUntil) return ::testing::AssertionSuccess();
        if (now >= deadline) {
            return ::testing::AssertionFailure() << "the program did not go quiet for " << quiet.count()
                                                 << " ms within " << timeout.count() << " ms\n"
                                                 << DumpLocked(false);
        }
        _changed.wait_until(lock, std::min(quietUntil, deadline));
    }
}

bool Terminal::Reap(int options) {
    if (_status) return true;
    int st = 0;
    pid_t r;
    do {
        r = waitpid(_pid, &st, options);
    } while (r < 0 && errno == EINTR);
    if (r == _pid) _status = st;
    return _status.has_value();
}

std::optional<int> Terminal::WaitForExit(Duration timeout) {
    const auto deadline = Clock::now() + timeout;
    while (!Reap(WNOHANG)) {
        if (Clock::now() >= deadline) return std::nullopt;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    // Let the reader take in the last output; the slave side closes with the
    // program unless something it started keeps it open.
    std::unique_lock lock(_mutex);
    _changed.wait_for(lock, std::chrono::milliseconds(500), [this] { return _eof; });
    return _status;
}

::testing::AssertionResult Terminal::ExitsWith(int code, Duration timeout) {
    std::optional<int> status = WaitForExit(timeout);
    if (status && WIFEXITED(*status) && WEXITSTATUS(*status) == code) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure()
           << "expected exit " << code << ", got " << DescribeStatus(status)
           << (status ? "" : " after " + std::to_string(timeout.count()) + " ms") << "\n"
           << Dump();
}

std::string Terminal::DescribeStatus(std::optional<int> status) {
    if (!status) return "running";
    if (WIFEXITED(*status)) return "exit " + std::to_string(WEXITSTATUS(*status));
    if (WIFSIGNALED(*status)) return "signal " + std::to_string(WTERMSIG(*status));
    return "status " + std::to_string(*status);
}

Cell Terminal::CellLocked(int col, int row) const {
    Cell cell;
    VTermScreenCell c;
    if (col < 0 || row < 0 || col >= _cols || row >= _rows ||
        !vterm_screen_get_cell(_screen, VTermPos{row, col}, &c)) {
        return cell;
    }
    if (c.chars[0] == 0) {
        cell.text = " ";
    } else if (c.chars[0] != uint32_t(-1)) {  // -1 marks the right half of a wide character
        for (int i = 0; i < VTERM_MAX_CHARS_PER_CELL && c.chars[i]; ++i) AppendUtf8(cell.text, c.chars[i]);
    }
    cell.fg = ToCellColor(c.fg, true);
    cell.bg = ToCellColor(c.bg, false);
    cell.bold = c.attrs.bold;
    cell.underline = c.attrs.underline != 0;
    cell.blink = c.attrs.blink;
    cell.reverse = c.attrs.reverse;
    return cell;
}

Cell Terminal::CellAt(int col, int row) const {
    std::lock_guard lock(_mutex);
    return CellLocked(col, row);
}

std::string Terminal::RowLocked(int row) const {
    std::string text;
    for (int col = 0; col < _cols; ++col) text += CellLocked(col, row).text;
    return text;
}

std::string Terminal::RowText(int row) const {
    std::lock_guard lock(_mutex);
    return RowLocked(row);
}

std::string Terminal::RowTextTrimmed(int row) const {
    std::string text = RowText(row);
    text.erase(text.find_last_not_of(' ') + 1);
    return text;
}

std::string Terminal::RegionText(int col, int row, int width, int height) const {
    std::lock_guard lock(_mutex);
    std::string joined;
    for (int r = row; r < row + height && r < _rows; ++r) {
        std::string line;
        for (int c = col; c < col + width && c < _cols; ++c) line += CellLocked(c, r).text;
        line = Trim(line);
        if (line.empty()) continue;
        if (!joined.empty()) joined += ' ';
        joined += line;
    }
    return joined;
}

std::string Terminal::ScreenText() const {
    std::lock_guard lock(_mutex);
    std::string text;
    for (int row = 0; row < _rows; ++row) {
        if (row) text += '\n';
        text += RowLocked(row);
    }
    return text;
}

std::vector<Pos> Terminal::FindLocked(std::string_view text, size_t most) const {
    std::vector<Pos> found;
    for (int row = 0; row < _rows && found.size() < most; ++row) {
        // Byte offset of each cell, to turn a match into a column.
        std::string line;
        std::vector<size_t> starts;
        for (int col = 0; col < _cols; ++col) {
            starts.push_back(line.size());
            line += CellLocked(col, row).text;
        }
        for (size_t at = line.find(text); at != std::string::npos && found.size() < most;
             at = line.find(text, at + text.size())) {
            int col = 0;
            while (col + 1 < _cols && starts[size_t(col) + 1] <= at) ++col;
            found.push_back({col, row});
        }
    }
    return found;
}

::testing::AssertionResult Terminal::HasTextAt(int col, int row, std::string_view text) const {
    std::lock_guard lock(_mutex);
    std::string line;
    for (int c = col; c < _cols; ++c) line += CellLocked(c, row).text;
    if (line.compare(0, text.size(), text) == 0) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "row " << row << " from column " << col << " reads \"" << line
                                         << "\", expected \"" << text << "\"\n"
                                         << DumpLocked(false);
}

::testing::AssertionResult Terminal::OnScreen(std::string_view text, bool shown) const {
    std::lock_guard lock(_mutex);
    if (FindLocked(text, 1).empty() != shown) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "\"" << text << (shown ? "\" not" : "\"") << " on the screen\n"
                                         << DumpLocked(false);
}

std::optional<Pos> Terminal::Find(std::string_view text) const {
    std::lock_guard lock(_mutex);
    const std::vector<Pos> found = FindLocked(text, 1);
    return found.empty() ? std::nullopt : std::optional<Pos>(found[0]);
}

std::vector<Pos> Terminal::FindAll(std::string_view text) const {
    if (text.empty()) return {};
    std::lock_guard lock(_mutex);
    return FindLocked(text, SIZE_MAX);
}

std::string Terminal::DumpLocked(bool colors) const {
    std::string out =
        "screen " + std::to_string(_cols) + "x" + std::to_string(_rows) + ", TERM=" + _options.term + ", " +
        std::to_string(_output.size()) + " bytes received" +
        (colors ? "; colours: . default, 0-f index, + higher index, # RGB; attributes: r reverse, "
                  "b bold, u underline"
                : "") +
        "\n";
    char num[16];
    for (int row = 0; row < _rows; ++row) {
        snprintf(num, sizeof num, "%3d|", row);
        out += num + RowLocked(row) + "|\n";
        if (!colors) continue;
        std::string fg = " fg|", bg = " bg|", at = " at|";
        bool anyAttr = false;
        for (int col = 0; col < _cols; ++col) {
            Cell cell = CellLocked(col, row);
            fg += ColorChar(cell.fg);
            bg += ColorChar(cell.bg);
            char a = cell.reverse ? 'r' : cell.bold ? 'b' : cell.underline ? 'u' : '.';
            anyAttr = anyAttr || a != '.';
            at += a;
        }
        out += fg + "|\n" + bg + "|\n";
        if (anyAttr) out += at + "|\n";
    }
    return out;
}

std::string Terminal::Dump(bool colors) const {
    std::lock_guard lock(_mutex);
    return DumpLocked(colors);
}

std::vector<PaletteChange> Terminal::PaletteLog() const {
    std::lock_guard lock(_mutex);
    return _palette;
}

std::optional<Rgb> Terminal::PaletteColor(int index) const {
    std::lock_guard lock(_mutex);
    for (auto it = _palette.rbegin(); it != _palette.rend(); ++it) {
        if (it->index == -1) break;
        if (it->index == index) return it->rgb;
    }
    return std::nullopt;
}

size_t Terminal::BytesReceived() const {
    std::lock_guard lock(_mutex);
    return _output.size();
}

std::string Terminal::Output() const {
    std::lock_guard lock(_mutex);
    return _output;
}

int Terminal::OpenDescriptors() const {
    DIR* dir = opendir(("/proc/" + std::to_string(_pid) + "/fd").c_str());
    if (!dir) return -1;
    int count = 0;
    while (const dirent* entry = readdir(dir))
        if (entry->d_name[0] != '.') ++count;
    closedir(dir);
    return count;
}

long Terminal::ResidentKiB() const {
    FILE* status = fopen(("/proc/" + std::to_string(_pid) + "/status").c_str(), "re");
    if (!status) return -1;
    long kib = -1;
    char line[256];
    while (fgets(line, sizeof line, status))
        if (sscanf(line, "VmRSS: %ld kB", &kib) == 1) break;
    fclose(status);
    return kib;
}

std::vector<std::pair<pid_t, char>> Terminal::Children() const {
    std::vector<std::pair<pid_t, char>> children;
    const std::string proc = "/proc/" + std::to_string(_pid);
    DIR* tasks = opendir((proc + "/task").c_str());
    if (!tasks) return children;
    while (const dirent* task = readdir(tasks)) {
        if (task->d_name[0] == '.') continue;
        FILE* list = fopen((proc + "/task/" + task->d_name + "/children").c_str(), "re");
        if (!list) continue;
        long child = 0;
        while (fscanf(list, "%ld", &child) == 1) {
            char state = '?';
            if (FILE* stat = fopen(("/proc/" + std::to_string(child) + "/stat").c_str(), "re")) {
                // "pid (name) S ...": the name may hold blanks and parentheses.
                char buf[512];
                const size_t n = fread(buf, 1, sizeof buf - 1, stat);
                buf[n] = '\0';
                if (const char* close = strrchr(buf, ')'); close && close[1] == ' ') state = close[2];
                fclose(stat);
            }
            children.emplace_back(pid_t(child), state);
        }
        fclose(list);
    }
    closedir(tasks);
    return children;
}

}  // namespace E2e
