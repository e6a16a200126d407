// openssl of the simulated host: the machine's own openssl, with the digest
// name of fingerprint lines in capitals ("SHA1 Fingerprint=..."), as the
// host's openssl prints them. OpenSSL 3 prints the name in small letters,
// which the console's reading of the certificate thumbprint does not accept.
#include <sys/wait.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "HostCommands.hpp"

namespace VelkTools {

namespace {

const char* const OPENSSL = "/usr/bin/openssl";

// "sha1 Fingerprint=AB:CD" -> "SHA1 Fingerprint=AB:CD"; other lines unchanged.
std::string CapitalizeDigest(const std::string& line) {
    static const std::string marker = " Fingerprint=";
    size_t at = line.find(marker);
    if (at == std::string::npos || at == 0) return line;
    std::string out = line;
    for (size_t i = 0; i < at; ++i) {
        unsigned char c = static_cast<unsigned char>(out[i]);
        if (!std::isalnum(c) && c != '-') return line;
        out[i] = char(std::toupper(c));
    }
    return out;
}

}  // namespace

int Openssl(const std::vector<std::string>& args) {
    int fds[2];
    if (pipe(fds) < 0) {
        std::fprintf(stderr, "openssl: cannot create a pipe: %s\n", std::strerror(errno));
        return 1;
    }
    pid_t pid = fork();
    if (pid < 0) {
        std::fprintf(stderr, "openssl: cannot start %s: %s\n", OPENSSL, std::strerror(errno));
        return 1;
    }
    if (pid == 0) {
        close(fds[0]);
        if (dup2(fds[1], 1) < 0) _exit(1);
        close(fds[1]);
        std::vector<char*> argv = {const_cast<char*>("openssl")};
        for (const std::string& a : args) argv.push_back(const_cast<char*>(a.c_str()));
        argv.push_back(nullptr);
        execv(OPENSSL, argv.data());
        std::fprintf(stderr, "openssl: cannot run %s: %s\n", OPENSSL, std::strerror(errno));
        _exit(127);
    }
    close(fds[1]);
    std::string output;
    char buf[4096];
    for (;;) {
        ssize_t n = read(fds[0], buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        output.append(buf, size_t(n));
    }
    close(fds[0]);

    std::string filtered;
    size_t start = 0;
    while (start < output.size()) {
        size_t end = output.find('\n', start);
        size_t next = end == std::string::npos ? output.size() : end + 1;
        std::string line = output.substr(start, (end == std::string::npos ? output.size() : end) - start);
        filtered += CapitalizeDigest(line) + (end == std::string::npos ? "" : "\n");
        start = next;
    }
    std::fwrite(filtered.data(), 1, filtered.size(), stdout);

    int status = 0;
    while (waitpid(pid, &status, 0) < 0) {
        if (errno != EINTR) return 1;
    }
    if (WIFEXITED(status)) return WEXITSTATUS(status);
    return 128 + (WIFSIGNALED(status) ? WTERMSIG(status) : 0);
}

}  // namespace VelkTools
