// Runs the console's PAM calls once and prints the PAM code, so that tests can
// run them in a fresh process under the PAM wrapper.
//   velk_pam_probe login USER SECRET
//   velk_pam_probe passwd USER OLD NEW
#include <cstdio>
#include <string>

#include "Pam.hpp"

int main(int argc, char** argv) {
    const std::string command = argc > 1 ? argv[1] : "";
    int rc;
    if (command == "login" && argc == 4) {
        rc = Velk::PamLogin(argv[2], argv[3]);
    } else if (command == "passwd" && argc == 5) {
        rc = Velk::PamChangePassword(argv[2], argv[3], argv[4]);
    } else {
        std::fputs("usage: velk_pam_probe login USER SECRET | passwd USER OLD NEW\n", stderr);
        return 2;
    }
    std::printf("%d\n", rc);
    return 0;
}
