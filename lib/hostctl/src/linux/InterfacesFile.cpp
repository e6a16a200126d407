// The interfaces files of ifupdown and ifupdown2, read and edited byte for
// byte. The text is the only state: parsing only records where the lines and
// words are, and every edit replaces a range of bytes and parses again.
#include "InterfacesFile.hpp"

#include <dirent.h>
#include <fcntl.h>
#include <glob.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>

#include "hostctl/Host.hpp"
#include "hostctl/HostCtl.hpp"

namespace HostCtl::Lib {

namespace {

// The blanks between words; '\n' only ends lines.
bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\v' || c == '\f'; }

std::string Trim(const std::string& s) {
    size_t b = 0, e = s.size();
    while (b < e && IsBlank(s[b])) ++b;
    while (e > b && IsBlank(s[e - 1])) --e;
    return s.substr(b, e - b);
}

bool IsHeaderKeyword(const std::string& word) {
    return word == "iface" || word == "mapping" || word == "auto" || word.rfind("allow-", 0) == 0 ||
           word == "source" || word == "source-directory" || word == "rename" || word == "no-auto-down" ||
           word == "no-scripts";
}

bool IsSource(const std::string& keyword) { return keyword == "source" || keyword == "source-directory"; }

// Option names as ifupdown2 compares them: "Bridge_Ports" is "bridge-ports".
std::string NormalName(const std::string& name) {
    std::string out = name;
    for (char& c : out) {
        if (c >= 'A' && c <= 'Z') c = char(c - 'A' + 'a');
        if (c == '_') c = '-';
    }
    return out;
}

// One word that stays one word on its own: no blanks, control characters
// or backslashes.
bool IsWord(const std::string& s) {
    if (s.empty()) return false;
    for (unsigned char c : s)
        if (c <= ' ' || c == 0x7f || c == '\\') return false;
    return true;
}

void RequireWord(const std::string& what, const std::string& s) {
    if (!IsWord(s)) throw HostCtlException("invalid " + what + " \"" + s + "\" for the interfaces file");
}

void RequireOptionName(const std::string& name) {
    RequireWord("option name", name);
    if (name[0] == '#' || IsHeaderKeyword(name))
        throw HostCtlException("invalid option name \"" + name + "\" for the interfaces file");
}

// A value that stays on its option's line: no line ends or control
// characters but tabs, and no final backslash that would join the next line.
void RequireValue(const std::string& value) {
    const std::string trimmed = Trim(value);
    bool valid = !trimmed.empty() && trimmed.back() != '\\';
    for (unsigned char c : value)
        if ((c < ' ' && c != '\t') || c == 0x7f) valid = false;
    if (!valid) throw HostCtlException("invalid option value \"" + value + "\" for the interfaces file");
}

}  // namespace

InterfacesFile::InterfacesFile(std::string text) : _text(std::move(text)) { Parse(); }

// Reads the logical line starting at `begin`: a physical line, and while the
// last one ends in a backslash (blanks after it allowed), the next physical
// line too. Comment and blank lines stand alone.
InterfacesFile::Line InterfacesFile::ReadLine(size_t begin) const {
    const size_t size = _text.size();
    auto physicalEnd = [&](size_t p) {
        const size_t nl = _text.find('\n', p);
        return nl == std::string::npos ? size : nl + 1;
    };
    auto contentEnd = [&](size_t p, size_t e) {
        if (e > p && _text[e - 1] == '\n') {
            --e;
            if (e > p && _text[e - 1] == '\r') --e;
        }
        return e;
    };

    Line line;
    line.begin = begin;
    size_t pos = begin, end = physicalEnd(pos), content = contentEnd(pos, end);
    size_t first = pos;
    while (first < content && IsBlank(_text[first])) ++first;
    const bool alone = first == content || _text[first] == '#';

    // Bytes ifupdown drops when it joins lines: a final backslash, the blanks
    // and the line end after it.
    std::vector<std::pair<size_t, size_t>> joints;
    for (;;) {
        size_t last = content;
        while (last > pos && IsBlank(_text[last - 1])) --last;
        if (alone || last == pos || _text[last - 1] != '\\') break;
        if (end == size) {
            line.open = true;
            joints.emplace_back(last - 1, content);
            break;
        }
        joints.emplace_back(last - 1, end);
        pos = end;
        end = physicalEnd(pos);
        content = contentEnd(pos, end);
    }
    line.end = end;
    line.contentEnd = content;

    // The words, with their bytes in the text and their place in the joined
    // line.
    size_t joint = 0;
    bool inWord = false;
    for (size_t p = begin; p < content;) {
        if (joint < joints.size() && p == joints[joint].first) {
            p = joints[joint++].second;
            continue;
        }
        const char c = _text[p];
        if (IsBlank(c)) {
            inWord = false;
        } else if (!inWord) {
            inWord = true;
            line.words.push_back({p, p + 1, line.joined.size(), line.joined.size() + 1});
        } else {
            line.words.back().end = p + 1;
            line.words.back().joinedEnd = line.joined.size() + 1;
        }
        line.joined += c;
        ++p;
    }

    if (line.words.empty())
        line.kind = Line::Blank;
    else if (line.joined[line.words[0].joinedBegin] == '#')
        line.kind = Line::Comment;
    else if (IsHeaderKeyword(line.WordText(0)))
        line.kind = Line::Header;
    return line;
}

void InterfacesFile::Parse() {
    _lines.clear();
    _stanzas.clear();
    _places.clear();
    // The stanza that option lines belong to: the last "iface" or "mapping"
    // header, until another header.
    std::optional<size_t> owner;
    for (size_t p = 0; p < _text.size();) {
        Line line = ReadLine(p);
        p = line.end;
        const size_t index = _lines.size();
        if (line.kind == Line::Header) {
            Stanza stanza;
            stanza.keyword = line.WordText(0);
            for (size_t w = 1; w < line.words.size(); ++w) stanza.words.push_back(line.WordText(w));
            owner.reset();
            if (stanza.keyword == "iface" || stanza.keyword == "mapping") owner = _stanzas.size();
            _stanzas.push_back(std::move(stanza));
            _places.push_back({index, {}, index});
        } else if (line.kind == Line::Other && owner) {
            line.kind = Line::Option;
            _places[*owner].options.push_back(index);
            _places[*owner].last = index;
        }
        _lines.push_back(std::move(line));
    }
}

const InterfacesFile::Place& InterfacesFile::At(size_t stanza) const {
    if (stanza >= _places.size())
        throw HostCtlException("the interfaces file has no stanza " + std::to_string(stanza));
    return _places[stanza];
}

std::vector<size_t> InterfacesFile::FindIface(const std::string& name,
                                              const std::optional<std::string>& family) const {
    std::vector<size_t> found;
    for (size_t s = 0; s < _stanzas.size(); ++s) {
        const Stanza& stanza = _stanzas[s];
        if (stanza.keyword == "iface" && stanza.Name() == name && (!family || stanza.Family() == *family))
            found.push_back(s);
    }
    return found;
}

std::vector<std::pair<std::string, std::string>> InterfacesFile::Options(size_t stanza) const {
    std::vector<std::pair<std::string, std::string>> options;
    for (size_t index : At(stanza).options) {
        const Line& line = _lines[index];
        options.emplace_back(line.WordText(0), Trim(line.joined.substr(line.words[0].joinedEnd)));
    }
    return options;
}

std::vector<size_t> InterfacesFile::OptionLines(size_t stanza, const std::string& option) const {
    std::vector<size_t> found;
    const std::string name = NormalName(option);
    for (size_t index : At(stanza).options)
        if (NormalName(_lines[index].WordText(0)) == name) found.push_back(index);
    return found;
}

std::vector<std::string> InterfacesFile::OptionValues(size_t stanza, const std::string& option) const {
    std::vector<std::string> values;
    for (size_t index : OptionLines(stanza, option)) {
        const Line& line = _lines[index];
        values.push_back(Trim(line.joined.substr(line.words[0].joinedEnd)));
    }
    return values;
}

std::optional<std::string> InterfacesFile::Option(size_t stanza, const std::string& option) const {
    std::vector<std::string> values = OptionValues(stanza, option);
    if (values.empty()) return std::nullopt;
    return values.front();
}

// The line end of the file's first line, so that added lines match it.
std::string InterfacesFile::LineEnd() const {
    const size_t nl = _text.find('\n');
    return nl != std::string::npos && nl > 0 && _text[nl - 1] == '\r' ? "\r\n" : "\n";
}

// The blanks before the stanza's first option, or a tab when it has none.
std::string InterfacesFile::Indent(size_t stanza) const {
    const Place& place = At(stanza);
    if (place.options.empty()) return "\t";
    const Line& line = _lines[place.options.front()];
    size_t end = line.begin;
    while (end < line.contentEnd && (_text[end] == ' ' || _text[end] == '\t')) ++end;
    return _text.substr(line.begin, end - line.begin);
}

void InterfacesFile::Splice(size_t begin, size_t end, const std::string& with) {
    _text.replace(begin, end - begin, with);
    Parse();
}

size_t InterfacesFile::InsertLines(size_t after, const std::vector<std::string>& lines) {
    const std::string eol = LineEnd();
    size_t at = _text.size();
    bool ended = true, open = false;
    if (after != std::string::npos || !_lines.empty()) {
        const Line& anchor = after != std::string::npos ? _lines[after] : _lines.back();
        at = anchor.end;
        ended = anchor.contentEnd != anchor.end;
        open = anchor.open;
    }
    // A last line without a line end gets one, and a backslash left open at
    // the end of the text is closed by an empty line, so that the new lines
    // stand on their own. A text that did not end with a line end still
    // does not.
    std::string text = std::string(ended ? "" : eol) + (open ? eol : "");
    const size_t first = at + text.size();
    for (size_t i = 0; i < lines.size(); ++i) {
        text += lines[i];
        if (i + 1 < lines.size() || ended) text += eol;
    }
    Splice(at, at, text);
    return first;
}

// Removes logical lines first..last. When they end the text without a line
// end, the line before them loses its line end, so the text still ends
// without one.
void InterfacesFile::EraseLines(size_t first, size_t last) {
    size_t begin = _lines[first].begin;
    const Line& end = _lines[last];
    if (end.end == _text.size() && end.contentEnd == end.end && first > 0)
        begin = _lines[first - 1].contentEnd;
    Splice(begin, end.end, "");
}

void InterfacesFile::SetMethod(size_t stanza, const std::string& method) {
    const Line& header = _lines[At(stanza).header];
    RequireWord("method", method);
    if (_stanzas[stanza].keyword != "iface" || header.words.size() < 3)
        throw HostCtlException("the stanza \"" + Trim(header.joined) + "\" has no address family");
    if (header.words.size() >= 4)
        Splice(header.words[3].begin, header.words[3].end, method);
    else
        Splice(header.words[2].end, header.words[2].end, " " + method);
}

void InterfacesFile::SetOption(size_t stanza, const std::string& option, const std::string& value) {
    const Place& place = At(stanza);
    RequireOptionName(option);
    RequireValue(value);
    if (_stanzas[stanza].keyword != "iface" && _stanzas[stanza].keyword != "mapping")
        throw HostCtlException("the stanza \"" + Trim(_lines[place.header].joined) + "\" takes no options");
    const std::vector<size_t> lines = OptionLines(stanza, option);
    if (lines.empty()) {
        InsertLines(place.last, {Indent(stanza) + option + " " + value});
        return;
    }
    // The lines after the first go, last first so that the earlier offsets
    // hold; the first keeps its indentation, the name as written and the
    // blanks after it.
    for (size_t i = lines.size() - 1; i > 0; --i) EraseLines(lines[i], lines[i]);
    const Line& line = _lines[lines.front()];
    size_t blanks = line.words[0].end;
    while (blanks < line.contentEnd && (_text[blanks] == ' ' || _text[blanks] == '\t')) ++blanks;
    const std::string separator =
        blanks > line.words[0].end ? _text.substr(line.words[0].end, blanks - line.words[0].end) : " ";
    const std::string replacement = _text.substr(line.begin, line.words[0].end - line.begin) + separator +
                                    value + _text.substr(line.contentEnd, line.end - line.contentEnd);
    Splice(line.begin, line.end, replacement);
}

void InterfacesFile::RemoveOption(size_t stanza, const std::string& option) {
    const std::vector<size_t> lines = OptionLines(stanza, option);
    for (size_t i = lines.size(); i > 0; --i) EraseLines(lines[i - 1], lines[i - 1]);
}

size_t InterfacesFile::AddIface(const std::string& name, const std::string& family, const std::string& method,
                                const std::vector<std::pair<std::string, std::string>>& options) {
    RequireWord("interface name", name);
    if (!family.empty() || !method.empty()) RequireWord("address family", family);
    if (!method.empty()) RequireWord("method", method);
    for (const auto& [option, value] : options) {
        RequireOptionName(option);
        RequireValue(value);
    }
    const std::vector<size_t> same = FindIface(name);
    size_t after = same.empty() ? std::string::npos : _places[same.back()].last;
    // Indented comments right after the stanza's options are the stanza's
    // own: the new stanza goes after them.
    while (after != std::string::npos && after + 1 < _lines.size() &&
           _lines[after + 1].kind == Line::Comment) {
        const std::string& text = _text;
        const size_t begin = _lines[after + 1].begin;
        if (begin >= text.size() || (text[begin] != ' ' && text[begin] != '\t')) break;
        ++after;
    }
    const std::string indent = same.empty() ? "\t" : Indent(same.back());

    std::vector<std::string> lines;
    if (after != std::string::npos || (!_lines.empty() && _lines.back().kind != Line::Blank))
        lines.emplace_back();
    std::string header = "iface " + name;
    if (!family.empty()) header += " " + family;
    if (!method.empty()) header += " " + method;
    lines.push_back(header);
    for (const auto& [option, value] : options) lines.push_back(indent + option + " " + value);

    const size_t headerAt = InsertLines(after, lines) + (lines.front().empty() ? LineEnd().size() : 0);
    for (size_t s = 0; s < _places.size(); ++s)
        if (_lines[_places[s].header].begin == headerAt) return s;
    throw HostCtlException("the added stanza of " + name + " is not in the interfaces file");
}

void InterfacesFile::RemoveStanza(size_t stanza) {
    const Place& place = At(stanza);
    size_t first = place.header;
    if (first > 0 && _lines[first - 1].kind == Line::Blank) --first;
    EraseLines(first, place.last);
}

namespace {

// The text and permission bits of a regular file on the host; false when it
// is missing, not a file or unreadable.
bool ReadHostFile(const std::string& path, std::string& text, mode_t& mode) {
    const int fd = open(HostPath(path).c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return false;
    struct stat st;
    bool ok = fstat(fd, &st) == 0 && S_ISREG(st.st_mode);
    if (ok) mode = st.st_mode & 07777;
    char buf[8192];
    while (ok) {
        const ssize_t n = read(fd, buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            ok = n == 0;
            break;
        }
        text.append(buf, size_t(n));
    }
    close(fd);
    return ok;
}

std::string Normal(const std::string& path) {
    return std::filesystem::path(path).lexically_normal().string();
}

// The host paths matching a shell pattern of host paths, sorted. The part
// of the mapped path before the host path is taken literally.
std::vector<std::string> Glob(const std::string& pattern) {
    const std::string mapped = HostPath(pattern);
    const std::string root = mapped.substr(0, mapped.size() - pattern.size());
    std::string escaped;
    for (char c : root) {
        if (c == '*' || c == '?' || c == '[' || c == '\\') escaped += '\\';
        escaped += c;
    }
    std::vector<std::string> found;
    glob_t matches;
    if (glob((escaped + pattern).c_str(), 0, nullptr, &matches) == 0) {
        for (size_t i = 0; i < matches.gl_pathc; ++i) {
            const std::string match = matches.gl_pathv[i];
            if (match.compare(0, root.size(), root) == 0) found.push_back(Normal(match.substr(root.size())));
        }
    }
    globfree(&matches);
    return found;
}

// The files of a folder that "source-directory" reads: names made only of
// ASCII letters, digits, "_" and "-", sorted.
std::vector<std::string> DirectoryFiles(const std::string& folder) {
    std::vector<std::string> names;
    DIR* dir = opendir(HostPath(folder).c_str());
    if (dir == nullptr) return names;
    while (const dirent* entry = readdir(dir)) {
        const std::string name = entry->d_name;
        const bool valid = std::all_of(name.begin(), name.end(), [](char c) {
            return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' ||
                   c == '-';
        });
        if (valid && !name.empty()) names.push_back(Normal(folder + "/" + name));
    }
    closedir(dir);
    std::sort(names.begin(), names.end());
    return names;
}

// The files a "source" or "source-directory" stanza of the file at `from`
// includes: each word a path or shell pattern, relative ones taken from the
// folder of `from`.
std::vector<std::string> Included(const std::string& from, const InterfacesFile::Stanza& stanza) {
    const std::string folder = from.substr(0, from.rfind('/'));
    std::vector<std::string> files;
    for (const std::string& word : stanza.words) {
        const std::string pattern = word[0] == '/' ? word : folder + "/" + word;
        for (const std::string& match : Glob(pattern)) {
            if (stanza.keyword == "source") {
                files.push_back(match);
            } else {
                for (const std::string& file : DirectoryFiles(match)) files.push_back(file);
            }
        }
    }
    return files;
}

}  // namespace

InterfacesFiles::InterfacesFiles(const std::string& path) { Load(Normal(path), 0); }

void InterfacesFiles::Load(const std::string& path, int depth) {
    // Bounds against include chains through links that name no file twice.
    if (depth > 16 || _files.size() >= 256) return;
    for (const File& file : _files)
        if (file.path == path) return;
    File file;
    file.path = path;
    if (!ReadHostFile(path, file.original, file.mode)) return;
    file.file = InterfacesFile(file.original);
    const size_t index = _files.size();
    const std::vector<InterfacesFile::Stanza> stanzas = file.file.Stanzas();
    _files.push_back(std::move(file));
    _includes.emplace_back();
    for (const InterfacesFile::Stanza& stanza : stanzas) {
        if (!IsSource(stanza.keyword)) continue;
        std::vector<size_t> brought;
        for (const std::string& included : Included(path, stanza)) {
            const size_t next = _files.size();
            Load(included, depth + 1);
            if (_files.size() > next) brought.push_back(next);
        }
        _includes[index].push_back(std::move(brought));
    }
}

void InterfacesFiles::Find(size_t file, const std::string& name, const std::optional<std::string>& family,
                           std::vector<Place>& out) const {
    const std::vector<InterfacesFile::Stanza>& stanzas = _files[file].file.Stanzas();
    size_t source = 0;
    for (size_t s = 0; s < stanzas.size(); ++s) {
        const InterfacesFile::Stanza& stanza = stanzas[s];
        if (stanza.keyword == "iface" && stanza.Name() == name && (!family || stanza.Family() == *family)) {
            out.push_back({file, s});
        } else if (IsSource(stanza.keyword)) {
            if (source < _includes[file].size())
                for (size_t included : _includes[file][source]) Find(included, name, family, out);
            ++source;
        }
    }
}

std::vector<InterfacesFiles::Place> InterfacesFiles::FindIface(
    const std::string& name, const std::optional<std::string>& family) const {
    std::vector<Place> found;
    if (!_files.empty()) Find(0, name, family, found);
    return found;
}

std::vector<InterfacesFiles::Change> InterfacesFiles::Changes() const {
    std::vector<Change> changes;
    for (const File& file : _files)
        if (file.file.Print() != file.original) changes.push_back({file.path, file.file.Print(), file.mode});
    return changes;
}

}  // namespace HostCtl::Lib
