// The editor of the ifupdown interfaces files.
//
// Input: the text of an interfaces file. Rules: it prints back byte for
// byte; for each "iface" stanza, setting an option, removing it and setting
// the method change only the lines of that option (or that header): the
// other lines stay, in order, with their bytes, the stanzas keep their
// headers, and the edited stanza reads back with the new value or method and
// its other options as they were. The lines are cut here by a reader of our
// own, so the editor's offsets are checked against an independent reading.
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "FuzzSupport.hpp"
#include "hostctl/HostCtl.hpp"
#include "linux/InterfacesFile.hpp"

namespace {

using fuzz_support::Require;
using HostCtl::Lib::InterfacesFile;

bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\v' || c == '\f'; }

std::string Normal(std::string name) {
    for (char& c : name) c = c == '_' ? '-' : (c >= 'A' && c <= 'Z') ? char(c - 'A' + 'a') : c;
    return name;
}

bool IsHeader(const std::string& word) {
    return word == "iface" || word == "mapping" || word == "auto" || word.rfind("allow-", 0) == 0 ||
           word == "source" || word == "source-directory" || word == "rename" || word == "no-auto-down" ||
           word == "no-scripts";
}

// A logical line as ifupdown reads it: physical lines joined while one ends
// in a backslash; comment and blank lines stand alone.
struct Logical {
    std::string raw;
    std::vector<std::string> words;
    int stanza = -1;    // the stanza whose header it is
    int optionOf = -1;  // the stanza whose option it is
};

std::vector<Logical> Read(const std::string& text) {
    std::vector<std::string> physical;
    for (size_t p = 0; p < text.size();) {
        const size_t nl = text.find('\n', p);
        const size_t end = nl == std::string::npos ? text.size() : nl + 1;
        physical.push_back(text.substr(p, end - p));
        p = end;
    }
    std::vector<Logical> lines;
    int stanzas = 0, owner = -1;
    for (size_t i = 0; i < physical.size(); ++i) {
        Logical line;
        std::string joined;
        for (bool first = true;; first = false) {
            line.raw += physical[i];
            std::string content = physical[i];
            if (!content.empty() && content.back() == '\n') content.pop_back();
            std::string trimmed = content;
            while (!trimmed.empty() && IsBlank(trimmed.back())) trimmed.pop_back();
            const size_t start = trimmed.find_first_not_of(" \t\r\v\f");
            const bool alone = first && (start == std::string::npos || trimmed[start] == '#');
            const bool joins = !alone && !trimmed.empty() && trimmed.back() == '\\';
            if (joins) trimmed.pop_back();
            joined += joins ? trimmed : content;
            if (!joins || i + 1 == physical.size()) break;
            ++i;
        }
        std::string word;
        for (char c : joined + " ") {
            if (IsBlank(c)) {
                if (!word.empty()) line.words.push_back(word);
                word.clear();
            } else {
                word += c;
            }
        }
        if (line.words.empty() || line.words[0][0] == '#') {
        } else if (IsHeader(line.words[0])) {
            line.stanza = stanzas;
            owner = line.words[0] == "iface" || line.words[0] == "mapping" ? stanzas : -1;
            ++stanzas;
        } else {
            line.optionOf = owner;
        }
        lines.push_back(std::move(line));
    }
    return lines;
}

// The text without the lines `drop` picks, ending line ends set aside (an
// edit at the end of a file adds or takes away the last line end).
template <typename Drop>
std::string Rest(const std::vector<Logical>& lines, Drop drop) {
    std::string rest;
    for (const Logical& line : lines)
        if (!drop(line)) rest += line.raw;
    while (!rest.empty() && (rest.back() == '\n' || rest.back() == '\r')) rest.pop_back();
    return rest;
}

bool Valid(const std::string& name) {
    if (name.empty() || name[0] == '#' || IsHeader(name)) return false;
    for (unsigned char c : name)
        if (c <= ' ' || c == 0x7f || c == '\\') return false;
    return true;
}

std::vector<std::pair<std::string, std::string>> Without(
    std::vector<std::pair<std::string, std::string>> options, const std::string& name) {
    std::vector<std::pair<std::string, std::string>> out;
    for (auto& option : options)
        if (Normal(option.first) != Normal(name)) out.push_back(std::move(option));
    return out;
}

// Every stanza keeps its header words (but the method of `edited` when
// `method` is set) and every stanza but `edited` its options.
void CheckStanzas(const InterfacesFile& before, const InterfacesFile& after, size_t edited, bool method,
                  const std::string& input) {
    Require(after.Stanzas().size() == before.Stanzas().size(), "an edit keeps the stanzas", input);
    for (size_t s = 0; s < before.Stanzas().size(); ++s) {
        InterfacesFile::Stanza a = after.Stanzas()[s], b = before.Stanzas()[s];
        if (method && s == edited && a.words.size() > 2 && b.words.size() >= 2) {
            a.words.erase(a.words.begin() + 2);
            if (b.words.size() > 2) b.words.erase(b.words.begin() + 2);
        }
        Require(a.keyword == b.keyword && a.words == b.words, "an edit keeps the other headers", input);
        if (s != edited)
            Require(after.Options(s) == before.Options(s), "other stanzas keep their options", input);
    }
}

void CheckOptionEdits(const InterfacesFile& file, size_t s, const std::string& option,
                      const std::string& input) {
    const std::vector<Logical> lines = Read(input);
    const auto owned = [&](const Logical& l) {
        return l.optionOf == int(s) && Normal(l.words[0]) == Normal(option);
    };
    const std::string rest = Rest(lines, owned);

    InterfacesFile set = file;
    set.SetOption(s, option, "192.0.2.7/24");
    Require(set.OptionValues(s, option) == std::vector<std::string>{"192.0.2.7/24"},
            "a set option has one line with the value", input);
    Require(Without(set.Options(s), option) == Without(file.Options(s), option),
            "setting an option keeps the stanza's other options", input);
    CheckStanzas(file, set, s, false, input);
    Require(Rest(Read(set.Print()), owned) == rest, "setting an option changes only its lines", input);

    InterfacesFile removed = file;
    removed.RemoveOption(s, option);
    Require(removed.Options(s) == Without(file.Options(s), option), "removing an option keeps the others",
            input);
    CheckStanzas(file, removed, s, false, input);
    const std::vector<Logical> after = Read(removed.Print());
    Require(Rest(after, owned) == rest && Rest(after, [](const Logical&) { return false; }) == rest,
            "removing an option takes only its lines", input);
}

void CheckSetMethod(const InterfacesFile& file, size_t s, const std::string& input) {
    InterfacesFile edited = file;
    const bool family = file.Stanzas()[s].words.size() >= 2;
    try {
        edited.SetMethod(s, "static");
    } catch (const HostCtl::Lib::HostCtlException&) {
        Require(!family, "a stanza with a family takes a method", input);
        Require(edited.Print() == input, "a refused edit changes nothing", input);
        return;
    }
    Require(family, "a stanza without a family refuses a method", input);
    Require(edited.Stanzas()[s].Method() == "static", "the method is set", input);
    Require(edited.Options(s) == file.Options(s), "setting the method keeps the options", input);
    CheckStanzas(file, edited, s, true, input);
    const auto header = [&](const Logical& l) { return l.stanza == int(s); };
    Require(Rest(Read(edited.Print()), header) == Rest(Read(input), header),
            "setting the method changes only the header", input);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size > 4096) return 0;
    const std::string input(reinterpret_cast<const char*>(data), size);
    const InterfacesFile file(input);
    Require(file.Print() == input, "a file prints back byte for byte", input);

    static const char* const NAMES[] = {"address", "Gateway", "bridge_ports", "mtu"};
    size_t tried = 0;
    for (size_t s = 0; s < file.Stanzas().size() && tried < 6; ++s) {
        if (file.Stanzas()[s].keyword != "iface") continue;
        // An option the stanza has (continuations, other spellings), or one
        // of a few common ones.
        const auto options = file.Options(s);
        std::string name = NAMES[tried % 4];
        if (tried % 2 == 0 && !options.empty() && Valid(options[0].first)) name = options[0].first;
        CheckOptionEdits(file, s, name, input);
        CheckSetMethod(file, s, input);
        ++tried;
    }
    return 0;
}
