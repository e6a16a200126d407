// The support information pages and the welcome message: texts a host
// installs or an administrator sets, shown in the console's mark-up with host
// values ("{hostname}", "{ip}", ...).
//
// Input: the first byte picks the screen width (80 to 300 columns) and the
// text (even: support information split into pages; odd: the welcome
// message); the rest is the text. Rules: pages split exactly at lines that
// hold only "%%" and end without a line break; every page and the message lay
// out within the area, with values that hold wide characters, combining
// characters and invalid UTF-8.
#include <algorithm>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "FuzzSupport.hpp"
#include "GeneralWindow.hpp"
#include "TextArea.hpp"
#include "WelcomeWindow.hpp"

namespace {

using fuzz_support::Require;

bool HostValue(const std::string& key, std::string& value) {
    static const std::map<std::string, std::string> values = {
        {"ip", "192.0.2.100"},
        {"hostname", "\u30db\u30b9\u30c8\u540d.example.test"},
        {"ssl-thumbprint", "AB:CD:EF:01:23:45:67:89:AB:CD:EF:01:23:45:67:89:AB:CD:EF:01"},
        {"ssh-rsa-fingerprint", "SHA256:abcdefghijklmnopqrstuvwxyz0123456789ABCDEFG"},
        {"ssh-dsa-fingerprint", ""},
        {"tarnproduct", "Tarni"},
        {"tarnversion", "8.0.2 (Build 22380479)"},
        {"memory", "16 GB"},
        {"assettag", "A\u0301SSET-\xff-{lbrace}"},
        {"BIOSversion", "2.4.1\n"},
        {"BMCversion", "N/A"},
        {"CPLDversion", "N/A"},
        {"PLSAversion", "\u4e09.\u3007"},
    };
    auto it = values.find(key);
    if (it == values.end()) return false;
    value = it->second;
    return true;
}

void CheckPages(const std::string& text, int width) {
    const std::vector<std::string> pages = Velk::GeneralWindow::SplitPages(text);
    // "%%" lines: at the start, after a line break, ending at a line break
    // or at the end of the text.
    size_t separators = 0;
    size_t start = 0;
    while (start < text.size()) {
        size_t end = text.find('\n', start);
        if (end == std::string::npos) end = text.size();
        if (text.compare(start, end - start, "%%") == 0) ++separators;
        start = end + 1;
    }
    Require(pages.size() == separators + 1, "one page more than separator lines", text);
    for (const std::string& page : pages) {
        Require(page.empty() || page.back() != '\n', "a page ends without a line break", text);
        Require(page != "%%" && page.rfind("%%\n", 0) != 0 && page.find("\n%%\n") == std::string::npos &&
                    (page.size() < 3 || page.compare(page.size() - 3, 3, "\n%%") != 0),
                "no page holds a separator line", text);
        fuzz_support::CheckLaidOut(Velk::TextArea::Layout(page, width, HostValue), width, page);
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1 || size > 8192) return 0;
    const int screenWidth = 80 + data[0] / 2 % 221;
    const std::string text(reinterpret_cast<const char*>(data) + 1, size - 1);
    if (data[0] % 2 == 0) {
        // The support pages fill the right half of the menu screen.
        CheckPages(text, std::max(1, screenWidth / 2 - 6));
    } else {
        // The welcome message fills the screen inside its border.
        const int width = screenWidth - 4;
        fuzz_support::CheckLaidOut(Velk::TextArea::Layout(text, width, HostValue), width, text);
        // The hardware line of the standard welcome screen.
        const size_t nl = text.find('\n');
        const std::string vendor = text.substr(0, nl);
        const std::string product = nl == std::string::npos ? "" : text.substr(nl + 1);
        const std::string line = Velk::WelcomeWindow::CombineVendorAndProduct(vendor, product);
        Require(line.find("  ") == std::string::npos, "the hardware line holds no double blank", line);
        Require(line.empty() || line.front() != ' ', "the hardware line starts with no blank", line);
        fuzz_support::CheckLaidOut(Velk::TextArea::Layout(Velk::TextArea::Escape(line), width, HostValue),
                                   width, line);
    }
    return 0;
}
