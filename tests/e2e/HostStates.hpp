// Malformed and extreme host states for the console to live through: each
// case breaks the simulated host's state (or one of its files) in its own way.
// The cases keep a copy of what they change so that the good state can come
// back.
#pragma once

#include <sys/stat.h>

#include <filesystem>
#include <functional>
#include <map>
#include <nlohmann/json.hpp>
#include <string>
#include <tuple>

#include "LoggedIn.hpp"

namespace E2e {

struct HostStateCase {
    const char* name;
    std::function<void(SimHost&)> apply;
};
inline void PrintTo(const HostStateCase& c, std::ostream* os) { *os << c.name; }

// The certificate and keys the cases break.
inline const std::vector<const char*> kKeyFiles = {
    "/etc/zolva/ssl/rui.crt",    "/etc/zolva/ssl/rui.key",        "/etc/ssh/ssh_host_rsa_key",
    "/etc/ssh/ssh_host_dsa_key", "/etc/ssh/ssh_host_rsa_key.pub", "/etc/ssh/ssh_host_dsa_key.pub"};

// The files the cases change, saved before and written back after.
class HostFiles {
public:
    explicit HostFiles(const SimHost& host) : _host(host) {
        _saved["/host.json"] = host.ReadFile("/host.json");
        for (const char* path : kKeyFiles) _saved[path] = host.ReadFile(path);
    }
    void Restore() const {
        for (const auto& [path, content] : _saved) {
            std::error_code ec;
            std::filesystem::remove_all(_host.Path(path), ec);
            _host.WriteFile(path, content);
        }
    }

private:
    const SimHost& _host;
    std::map<std::string, std::string> _saved;
};

namespace HostStates {

using nlohmann::json;

// Changes the state file through `edit`, without any check of the result.
inline std::function<void(SimHost&)> Edit(std::function<void(json&)> edit) {
    return [edit](SimHost& host) {
        json state = json::parse(host.ReadFile("/host.json"));
        edit(state);
        host.WriteFile("/host.json", state.dump(1));
    };
}
// Replaces a file by `content` as it is, or by a folder when `content` is null.
inline std::function<void(SimHost&)> Replace(const char* path, const char* content) {
    return [path, content](SimHost& host) {
        std::filesystem::remove_all(host.Path(path));
        if (content) {
            host.WriteFile(path, content);
        } else {
            std::filesystem::create_directories(host.Path(path));
        }
    };
}
inline std::function<void(SimHost&)> RemoveFiles(std::vector<const char*> paths) {
    return [paths](SimHost& host) {
        for (const char* path : paths) host.RemoveFile(path);
    };
}

inline std::string Repeat(const std::string& piece, size_t count) {
    std::string s;
    while (count-- > 0) s += piece;
    return s;
}

inline json& Mgmt(json& state) { return state["network"]["vnics"][0]; }

inline json Nic(int i) {
    char mac[32];
    snprintf(mac, sizeof mac, "00:50:56:02:%02x:%02x", i / 256, i % 256);
    return {{"name", "zonic" + std::to_string(i)},
            {"mac", mac},
            {"driver", "e1000e"},
            {"description", "Acme Gigabit Ethernet Controller"},
            {"label", ""},
            {"linkUp", i % 3 != 0},
            {"speedMbps", i % 3 != 0 ? 1000 : 0}};
}

// A whole state file cut in the middle of its text.
inline void Truncate(SimHost& host) {
    const std::string text = host.ReadFile("/host.json");
    host.WriteFile("/host.json", text.substr(0, text.size() / 2));
}

inline const std::vector<HostStateCase>& Cases() {
    static const std::vector<HostStateCase> cases = {
        {"TruncatedState", Truncate},
        {"StateNotJson", Replace("/host.json", "not json \xff\xfe {")},
        {"StateIsAnArray", Replace("/host.json", "[1, 2, 3]")},
        {"StateIsAFolder", Replace("/host.json", nullptr)},
        {"StateMissing", RemoveFiles({"/host.json"})},
        {"WrongTypesTopLevel", Edit([](json& s) {
             s["network"] = "network";
             s["hardware"] = 5;
             s["version"] = json::array();
             s["system"]["welcomeMessage"] = 42;
         })},
        {"WrongTypesInside", Edit([](json& s) {
             Mgmt(s)["ipv4"]["address"] = 12;
             Mgmt(s)["ipv6"]["addresses"] = "fe80::1";
             s["network"]["pnics"] = json::object();
             s["network"]["dns"]["hostname"] = nullptr;
             s["hardware"]["cpu"]["packages"] = "two";
             s["smartCards"]["slots"] = 3;
         })},
        {"MissingObjects", Edit([](json& s) {
             s.erase("hardware");
             s.erase("version");
             s["network"].erase("dns");
             s["network"].erase("vnics");
             s.erase("smartCards");
         })},
        {"LongValues", Edit([](json& s) {
             const std::string longText = Repeat("0123456789", 1000);
             s["network"]["dns"]["hostname"] = longText;
             s["hardware"]["vendor"] = longText;
             s["hardware"]["product"] = longText;
             s["hardware"]["cpu"]["model"] = longText;
             s["version"]["build"] = longText;
             s["network"]["dns"]["domain"] = longText;
         })},
        {"LongWelcomeMessage",
         Edit([](json& s) { s["system"]["welcomeMessage"] = Repeat("Welcome to a long message. ", 370); })},
        {"LongUnbrokenWelcomeMessage",
         Edit([](json& s) { s["system"]["welcomeMessage"] = Repeat("x", 10000); })},
        {"InvalidUtf8",
         [](SimHost& host) {
             std::string text = host.ReadFile("/host.json");
             const std::string from = "\"Acme Server 9\"";
             if (const size_t at = text.find(from); at != std::string::npos)
                 text.replace(at, from.size(), "\"Acme \xc3\x28 Server \xff\xfe 9\"");
             host.WriteFile("/host.json", text);
         }},
        {"WideAndCombiningHostName", Edit([](json& s) {
             s["network"]["dns"]["hostname"] = "主机-ホスト-호스트-e\u0301\u0301-\u200b-" + Repeat("漢", 40);
         })},
        {"WideAndCombiningWelcomeMessage", Edit([](json& s) {
             s["system"]["welcomeMessage"] =
                 Repeat("漢字かなカナ한글 ", 60) + Repeat("e\u0301a\u0308o\u0302 ", 60) + Repeat("😀", 80);
         })},
        {"ControlCharactersInTexts", Edit([](json& s) {
             s["network"]["dns"]["hostname"] = "host\x1b[2J\x1b[31mred\x07\tx";
             s["hardware"]["product"] = "Server\x1b]0;title\x07\x08\x08\x08";
         })},
        {"ControlCharactersInWelcomeMessage", Edit([](json& s) {
             s["system"]["welcomeMessage"] = "Hello\x1b[2J\x1b[H\x1b[7m reversed \x0e\x0f\x07\x7f";
         })},
        {"NegativeNumbers", Edit([](json& s) {
             s["hardware"]["memory"]["totalPages"] = -1;
             s["hardware"]["memory"]["pageSize"] = -4096;
             s["hardware"]["cpu"]["packages"] = -2;
             s["version"]["buildNumber"] = -1;
             s["advancedOptions"]["/UserVars/VelkTimeOut"] = -5;
         })},
        {"HugeNumbers", Edit([](json& s) {
             s["hardware"]["memory"]["totalPages"] = 18446744073709551615ull;
             s["hardware"]["memory"]["pageSize"] = 9223372036854775807ll;
             s["hardware"]["cpu"]["packages"] = 4294967296ll;
             s["version"]["buildNumber"] = 1e300;
             s["advancedOptions"]["/UserVars/VelkTimeOut"] = 9223372036854775807ll;
         })},
        {"NoNics", Edit([](json& s) {
             s["network"]["pnics"] = json::array();
             s["network"]["vnics"] = json::array();
         })},
        {"SixtyFourNics", Edit([](json& s) {
             json& pnics = s["network"]["pnics"];
             for (int i = int(pnics.size()); i < 64; ++i) pnics.push_back(Nic(i));
         })},
        {"HundredIpv6Addresses", Edit([](json& s) {
             json& addresses = Mgmt(s)["ipv6"]["addresses"];
             for (int i = 1; i <= 100; ++i) {
                 char address[64];
                 snprintf(address, sizeof address, "2001:db8:ffff:ffff:ffff:ffff:ffff:%x", i);
                 addresses.push_back({{"address", address}, {"prefix", 128}, {"type", "static"}});
             }
         })},
        {"MissingCertificateAndKeys", RemoveFiles(kKeyFiles)},
        {"GarbageCertificateAndKeys",
         [](SimHost& host) {
             host.WriteFile("/etc/zolva/ssl/rui.crt", "-----BEGIN CERTIFICATE-----\nnot base64 \xff\n");
             host.WriteFile("/etc/ssh/ssh_host_rsa_key", std::string(10000, 'k'));
             host.WriteFile("/etc/ssh/ssh_host_rsa_key.pub", "ssh-rsa \xff\xfe");
         }},
        {"UnreadableCertificateAndKeys",
         [](SimHost& host) {
             for (const char* path : {"/etc/zolva/ssl/rui.crt", "/etc/ssh/ssh_host_rsa_key",
                                      "/etc/ssh/ssh_host_rsa_key.pub", "/etc/ssh/ssh_host_dsa_key"})
                 Replace(path, nullptr)(host);
         }},
    };
    return cases;
}

}  // namespace HostStates

// Whether the screen's outer box is whole: corners, the bottom line, and
// the left and right borders on every row between them (joints of inner
// lines allowed).
inline ::testing::AssertionResult FrameIntact(const Terminal& t) {
    const int cols = t.Cols();
    // The bottom line is the screen's last row or (in the menu) the one above.
    int rows = t.Rows();
    if (t.CellAt(0, rows - 1).text != "└" && t.CellAt(0, rows - 2).text == "└") rows -= 1;
    // Each place of the frame and what may stand there.
    std::vector<std::tuple<int, int, std::string, std::string>> frame = {
        {0, 0, "┌", "┌"}, {cols - 1, 0, "┐", "┐"}, {0, rows - 1, "└", "└"}, {cols - 1, rows - 1, "┘", "┘"}};
    // The bottom line and the sides; the top line may carry a title.
    for (int col = 1; col < cols - 1; ++col) frame.emplace_back(col, rows - 1, "─", "┴");
    for (int row = 1; row < rows - 1; ++row) {
        frame.emplace_back(0, row, "│", "├");
        frame.emplace_back(cols - 1, row, "│", "┤");
    }
    for (const auto& [col, row, line, joint] : frame) {
        const std::string text = t.CellAt(col, row).text;
        if (text != line && text != joint)
            return ::testing::AssertionFailure() << "\"" << text << "\" at column " << col << ", row " << row
                                                 << " where the frame has " << line << "\n"
                                                 << t.Dump();
    }
    return ::testing::AssertionSuccess();
}

// Waits until the screen's frame has begun (its top-left corner) or the
// program has ended, then for quiet. Whether the program still runs.
inline bool WaitForFrame(Terminal& t, Duration timeout = kDefaultTimeout) {
    return Eventually([&] { return t.CellAt(0, 0).text == "┌" || t.HasExited(); }, timeout) &&
           t.WaitQuiet(Duration(200)) && !t.HasExited();
}

}  // namespace E2e
