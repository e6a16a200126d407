// A password typed into the console is used for the log-in and then kept
// nowhere: not in any file of the host, not in what the console wrote to the
// terminal, not in the environment or command line of the console or of
// anything it starts, and not in the console's memory once the log-in is over.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <fstream>
#include <future>
#include <iterator>
#include <memory>
#include <random>
#include <set>
#include <sstream>

#include "LoggedIn.hpp"

namespace E2e {
namespace {

namespace fs = std::filesystem;

// A password that occurs nowhere by chance.
std::string UniquePassword() {
    std::random_device random;
    std::string password = "Sq-";
    for (int i = 0; i < 20; ++i)
        password += "abcdefghijkmnpqrstuvwxyzACDEFGHJKLMNPQRTUVWXY34679"[random() % 50];
    return password;
}

std::string ReadAll(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

// Some bytes around `at` in `data`, readable.
std::string Context(std::string_view data, size_t at, size_t length) {
    const size_t from = at > 24 ? at - 24 : 0;
    std::string out;
    for (char c : data.substr(from, length + 48)) {
        const auto u = static_cast<unsigned char>(c);
        out += u >= 0x20 && u < 0x7f ? c : '.';
    }
    return out;
}

// The process and all its descendants.
std::vector<pid_t> Tree(pid_t pid) {
    std::vector<pid_t> all{pid};
    for (size_t i = 0; i < all.size(); ++i) std::ranges::copy(ChildrenOf(all[i]), std::back_inserter(all));
    return all;
}

// Where `secret` shows in the environment or command line of `pid` or its
// descendants, watched from a thread of its own until `stop`: children come
// and go quickly. `reads` counts the files read.
std::set<std::string> WatchProcesses(pid_t pid, const std::string& secret, const std::atomic<bool>& stop,
                                     long& reads) {
    std::set<std::string> found;
    while (!stop.load()) {
        for (pid_t p : Tree(pid)) {
            for (const char* file : {"environ", "cmdline"}) {
                const std::string path = "/proc/" + std::to_string(p) + "/" + file;
                const std::string data = ReadAll(path);
                reads += !data.empty();
                if (data.find(secret) != std::string::npos)
                    found.insert(path + " (" + ReadAll("/proc/" + std::to_string(p) + "/comm") + ")");
            }
        }
        std::this_thread::sleep_for(Duration(2));
    }
    return found;
}

// Places of `secret` in the readable memory of `pid`: "address: context".
// `scanned` receives the number of bytes read.
std::vector<std::string> SearchMemory(pid_t pid, const std::string& secret, size_t& scanned) {
    std::vector<std::string> found;
    scanned = 0;
    std::ifstream maps("/proc/" + std::to_string(pid) + "/maps");
    const int mem = open(("/proc/" + std::to_string(pid) + "/mem").c_str(), O_RDONLY | O_CLOEXEC);
    if (mem < 0) return {"cannot open /proc/PID/mem: " + std::string(strerror(errno))};
    std::string line;
    std::vector<char> buffer;
    while (std::getline(maps, line)) {
        unsigned long start = 0, end = 0;
        char perms[8] = {};
        if (sscanf(line.c_str(), "%lx-%lx %7s", &start, &end, perms) != 3 || perms[0] != 'r') continue;
        if (line.find("[vvar]") != std::string::npos || line.find("[vsyscall]") != std::string::npos)
            continue;
        // Huge reservations (the sanitizer's shadow) hold no data of the
        // program's own.
        if (end - start > (1ul << 32)) continue;
        buffer.resize(end - start);
        const ssize_t n = pread(mem, buffer.data(), buffer.size(), off_t(start));
        if (n <= 0) continue;
        scanned += size_t(n);
        const std::string_view data(buffer.data(), size_t(n));
        for (size_t at = data.find(secret); at != std::string_view::npos; at = data.find(secret, at + 1)) {
            char address[32];
            snprintf(address, sizeof address, "%#lx", start + at);
            found.push_back(std::string(address) + " in " + line + ": " + Context(data, at, secret.size()));
        }
    }
    close(mem);
    return found;
}

// The test's PAM module reads the password file, which holds the password in
// clear ("root:PASSWORD:velk"); copies of that line in the console's memory
// come from the module, not from the console. A real host keeps only hashes.
bool FromPasswordFile(const std::string& place, const std::string& secret) {
    const size_t colon = place.rfind(": ");
    const std::string context = place.substr(colon + 2);
    const size_t at = context.find(secret);
    if (at == std::string::npos) return false;
    const std::string before = context.substr(0, at), after = context.substr(at + secret.size());
    return (before.ends_with("root:") || before.ends_with("root.")) &&
           (after.starts_with(":velk") || after.starts_with(".velk"));
}

using SecretsTest = ConsoleTest;

TEST_F(SecretsTest, PasswordKeptNowhereAfterTheLogin) {
    const std::string password = UniquePassword();
    SetRootPassword(host, password);
    ASSERT_TRUE(Start());
    std::atomic<bool> stop{false};
    long reads = 0;
    std::future<std::set<std::string>> watch =
        std::async(std::launch::async, WatchProcesses, t->Pid(), password, std::cref(stop), std::ref(reads));
    // Stops the watch also when an assertion below ends the test early.
    const std::unique_ptr<std::atomic<bool>, void (*)(std::atomic<bool>*)> stopper(
        &stop, [](std::atomic<bool>* s) { *s = true; });
    t->SendKey("F2");
    ASSERT_TRUE(t->WaitForText("Login Name:"));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitQuiet());
    t->Send(password);
    ASSERT_TRUE(t->WaitQuiet());
    // While typed in, the password is in the console's memory: the search
    // finds what is there (once the console has read the keys; a loaded
    // machine may take a while).
    size_t scanned = 0;
    EXPECT_TRUE(Eventually([&] { return !SearchMemory(t->Pid(), password, scanned).empty(); }))
        << scanned << " bytes read";
    t->SendKey("Enter");
    ASSERT_TRUE(WaitForMenu(*t));
    // Pages that run host tools, so that their children are watched too.
    ASSERT_TRUE(SelectEntry(*t, "View Support Information"));
    ASSERT_TRUE(SelectEntry(*t, "Configure Lockdown Mode", true));
    t->SendKey("Enter");
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    t->SendKey("Esc");
    ASSERT_TRUE(t->WaitQuiet(Duration(300)));
    stop = true;
    const std::set<std::string> found = watch.get();
    ASSERT_FALSE(t->HasExited());

    // The environment and command lines.
    EXPECT_GT(reads, 0);
    for (const std::string& place : found) ADD_FAILURE() << "the password is in " << place;

    // The terminal output.
    const std::string output = t->Output();
    EXPECT_EQ(output.find(password), std::string::npos)
        << "the console wrote the password: " << Context(output, output.find(password), password.size());

    // Every file of the host but the password file the test's PAM module reads.
    const std::string passdb = host.Path("/etc/pam-wrapper/passdb");
    size_t files = 0;
    for (const auto& entry : fs::recursive_directory_iterator(host.Root())) {
        if (!entry.is_regular_file() || entry.path() == passdb) continue;
        ++files;
        const std::string content = ReadAll(entry.path());
        if (const size_t at = content.find(password); at != std::string::npos)
            ADD_FAILURE() << "the password is in " << entry.path() << ": "
                          << Context(content, at, password.size());
    }
    EXPECT_GT(files, 10u);

    // The console's memory, the log-in over and the menu showing.
    std::vector<std::string> places = SearchMemory(t->Pid(), password, scanned);
    EXPECT_GT(scanned, 1u << 20) << "too little memory read";
    const size_t moduleCopies =
        std::erase_if(places, [&](const std::string& place) { return FromPasswordFile(place, password); });
    std::cout << scanned << " bytes of memory read; " << moduleCopies
              << " copies of the password file's line left aside\n";
    for (const std::string& place : places)
        ADD_FAILURE() << "the password is in the console's memory at " << place;
}

}  // namespace
}  // namespace E2e
