// velk_screenshots DIR: runs the console on a simulated host through a few
// scripted sessions and writes pictures of its screens into DIR as SVG:
// welcome screen, login dialog, main menu, management network window and the
// shut-down/restart question. Run by scripts/screenshots.sh for the README.
#include <cstdio>
#include <fstream>
#include <functional>
#include <string>

#include "LoggedIn.hpp"
#include "SimHost.hpp"
#include "SvgWriter.hpp"
#include "Terminal.hpp"

namespace {

using E2e::Terminal;
using Step = std::function<::testing::AssertionResult(Terminal&)>;

struct Picture {
    const char* file;
    const char* title;
    Step reach;  // from the welcome screen to the screen to draw
};

const Picture kPictures[] = {
    {"welcome.svg", "The welcome screen", [](Terminal&) { return ::testing::AssertionSuccess(); }},
    {"login.svg", "The login dialog",
     [](Terminal& t) {
         t.SendKey("F2");
         return t.WaitForText("Login Name:");
     }},
    {"menu.svg", "The system customization menu", [](Terminal& t) { return E2e::LogInToMenu(t); }},
    {"network.svg", "The management network window",
     [](Terminal& t) {
         if (auto menu = E2e::LogInToMenu(t); !menu) return menu;
         if (auto selected = E2e::SelectEntry(t, "Configure Management Network"); !selected) return selected;
         t.SendKey("Enter");
         return t.WaitForText("Network Adapters");
     }},
    {"shutdown.svg", "Shutting down or restarting the host",
     [](Terminal& t) {
         if (auto submitted = E2e::SubmitLogin(t, E2e::kRootPassword, "", "F12"); !submitted)
             return submitted;
         return t.WaitForText("Forcefully terminate running VMs");
     }},
};

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: velk_screenshots DIR\n");
        return 2;
    }
    const std::string dir = argv[1];
    for (const Picture& picture : kPictures) {
        // A fresh host for each picture, with the same name, network and
        // password every time.
        E2e::SimHost host("host1.example.test");
        E2e::SetRootPassword(host);
        Terminal t(E2e::PamConsole(host));
        ::testing::AssertionResult shown = E2e::WaitForWelcome(t);
        if (shown) shown = picture.reach(t);
        if (!shown) {
            std::fprintf(stderr, "%s: %s\n", picture.file, shown.message());
            return 1;
        }
        E2e::SvgOptions options;
        options.title = picture.title;
        const std::string path = dir + "/" + picture.file;
        std::ofstream out(path);
        out << E2e::ToSvg(E2e::Capture(t), options);
        if (!out.flush()) {
            std::fprintf(stderr, "%s: cannot write\n", path.c_str());
            return 1;
        }
        std::printf("%s\n", path.c_str());
    }
    return 0;
}
