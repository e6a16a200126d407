// The network configuration files of ifupdown and ifupdown2
// (/etc/network/interfaces and the files it sources), read and edited without
// losing a byte: a file is kept as its text, edits replace only the bytes of
// the lines they change, and every other byte (comments, blank lines,
// options we do not know, line ends, a missing final line end, stanzas we
// cannot read) stays as it was.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace HostCtl::Lib {

// One interfaces file. Parsing never fails: a line that is not understood is
// kept as it is and belongs to no stanza. The stanza indices of Stanzas() stay
// valid across option and method edits; AddIface and RemoveStanza renumber
// the stanzas after the point they change.
class InterfacesFile {
public:
    // A stanza: a header line ("iface", "mapping", "auto", "allow-*",
    // "source", "source-directory", "rename", "no-auto-down", "no-scripts")
    // and, for "iface" and "mapping", the option lines after it.
    struct Stanza {
        std::string keyword;             // the header's first word
        std::vector<std::string> words;  // the header's other words
        // For "iface NAME [FAMILY [METHOD ...]]": the words, or "" when
        // missing (ifupdown2 accepts "iface vmbr1" alone).
        std::string Name() const { return Word(0); }
        std::string Family() const { return Word(1); }
        std::string Method() const { return Word(2); }

    private:
        std::string Word(size_t i) const { return i < words.size() ? words[i] : ""; }
    };

    explicit InterfacesFile(std::string text = "");

    // The whole text, the input byte for byte until an edit changes it.
    const std::string& Print() const { return _text; }

    const std::vector<Stanza>& Stanzas() const { return _stanzas; }

    // The "iface" stanzas of `name`, in file order; with `family`, only
    // those of that family ("inet", "inet6", or "" for none).
    std::vector<size_t> FindIface(const std::string& name,
                                  const std::optional<std::string>& family = std::nullopt) const;

    // The options of a stanza in file order: the name as written and the
    // value (the rest of the line, continuation lines joined, trimmed).
    std::vector<std::pair<std::string, std::string>> Options(size_t stanza) const;

    // The values of every line of `option` in the stanza. Option names compare
    // without regard to case and with "_" equal to "-" ("bridge_ports" is
    // "bridge-ports").
    std::vector<std::string> OptionValues(size_t stanza, const std::string& option) const;
    // The value of the option's first line, if it has one.
    std::optional<std::string> Option(size_t stanza, const std::string& option) const;

    // Edits. Each throws HostCtlException, changing nothing, when the stanza
    // does not exist or a name or value would not stay on its own line as one
    // option (line ends, a final backslash, an empty value, a header keyword as
    // option name, a name with blanks).

    // Sets the method word of an "iface" stanza with a family ("static",
    // "dhcp", "manual", "auto", ...); the rest of the header stays.
    void SetMethod(size_t stanza, const std::string& method);
    // Gives the option one line with `value`: the first line of the option
    // gets the value and the other lines of the option go; without one, a new
    // line goes after the stanza's last option line (after the header when it
    // has none), indented like the stanza's first option, or with a tab.
    void SetOption(size_t stanza, const std::string& option, const std::string& value);
    // Removes every line of the option (continuation lines included).
    void RemoveOption(size_t stanza, const std::string& option);
    // Adds "iface NAME FAMILY METHOD" and its options after the last stanza
    // of the same interface, or at the end of the file, with a blank line
    // before it; the options are indented like those of the stanza it
    // follows, or with a tab. `family` and `method` may be "" (left out).
    // Returns the new stanza's index.
    size_t AddIface(const std::string& name, const std::string& family, const std::string& method,
                    const std::vector<std::pair<std::string, std::string>>& options = {});
    // Removes the stanza's header and option lines, the comments and blank
    // lines between them, and the blank line just before the header.
    void RemoveStanza(size_t stanza);

private:
    // A word of a logical line: its bytes in the text (continuations inside
    // included) and its place in the joined line.
    struct Word {
        size_t begin, end;
        size_t joinedBegin, joinedEnd;
    };
    // A logical line: one physical line and the ones a final backslash joins
    // to it.
    struct Line {
        enum Kind { Blank, Comment, Header, Option, Other };
        size_t begin = 0, end = 0;  // its bytes, line ends included
        size_t contentEnd = 0;      // `end` without the last line end
        bool open = false;          // ends in a backslash at the end of the text
        Kind kind = Other;
        std::string joined;  // the text ifupdown reads: continuations joined, no line end
        std::vector<Word> words;
        std::string WordText(size_t i) const {
            return joined.substr(words[i].joinedBegin, words[i].joinedEnd - words[i].joinedBegin);
        }
    };
    struct Place {
        size_t header = 0;            // line index of the header
        std::vector<size_t> options;  // line indices of the option lines
        size_t last = 0;              // the last header or option line
    };

    void Parse();
    Line ReadLine(size_t begin) const;
    const Place& At(size_t stanza) const;
    std::vector<size_t> OptionLines(size_t stanza, const std::string& option) const;
    std::string LineEnd() const;
    // Replaces bytes [begin, end) of the text with `with` and parses again.
    void Splice(size_t begin, size_t end, const std::string& with);
    // Inserts whole lines after logical line `after` (or at the end of the
    // text when `after` is npos); returns the offset of the first one.
    size_t InsertLines(size_t after, const std::vector<std::string>& lines);
    // Removes logical lines first..last.
    void EraseLines(size_t first, size_t last);
    std::string Indent(size_t stanza) const;

    std::string _text;
    std::vector<Line> _lines;
    std::vector<Stanza> _stanzas;
    std::vector<Place> _places;  // per stanza
};

// The configuration as ifupdown reads it: a file and every file its "source"
// and "source-directory" lines include, depth first, in the order ifupdown
// reads them. Paths are host paths ("/etc/network/interfaces.d/vmbr0"),
// read through HostPath. Missing or unreadable files and loops are skipped
// (no files at all when the first one is missing). Edit a file through
// Files()[i].file, then write each of Changes() (ReplaceFile keeps the mode).
class InterfacesFiles {
public:
    struct File {
        std::string path;      // absolute host path
        mode_t mode = 0644;    // permission bits when read
        std::string original;  // the text as read
        InterfacesFile file;   // the text with the edits made so far
    };
    struct Place {
        size_t file;
        size_t stanza;
    };
    struct Change {
        std::string path;
        std::string text;
        mode_t mode;
    };

    // Reads `path` (an absolute host path) and what it includes.
    explicit InterfacesFiles(const std::string& path = "/etc/network/interfaces");

    std::vector<File>& Files() { return _files; }
    const std::vector<File>& Files() const { return _files; }

    // The "iface" stanzas of `name` (of `family`, when given) in the order
    // ifupdown reads them, a sourced file's stanzas at its "source" line.
    std::vector<Place> FindIface(const std::string& name,
                                 const std::optional<std::string>& family = std::nullopt) const;

    // The files whose text an edit changed, with their new text.
    std::vector<Change> Changes() const;

private:
    void Load(const std::string& path, int depth);
    void Find(size_t file, const std::string& name, const std::optional<std::string>& family,
              std::vector<Place>& out) const;

    std::vector<File> _files;
    // Per file, per "source"/"source-directory" stanza in order: the files it
    // brought in.
    std::vector<std::vector<std::vector<size_t>>> _includes;
};

}  // namespace HostCtl::Lib
