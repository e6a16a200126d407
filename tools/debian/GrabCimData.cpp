// grabCIMData of a Debian host: the one CIM property the console reads that
// the machine has, the firmware (BIOS) version, from DMI. Other classes have
// no instances here.
#include "DebianTools.hpp"
#include "HostSystem.hpp"

namespace VelkDebian {

int GrabCimData(const Args& args) {
    if (args.size() != 2) {
        Complain("grabCIMData: expected a class and a property\nusage: grabCIMData CLASS PROPERTY\n");
        return 1;
    }
    const std::string& className = args[0];
    const std::string& property = args[1];
    std::string version;
    if (className == "OMC_SMASHFirmwareIdentity") {
        if (property != "VersionString") {
            Complain("grabCIMData: class " + className + " has no property " + property + "\n");
            return 1;
        }
        // One line of text; a missing or empty file (a machine without DMI,
        // a container) means no instance.
        version = ReadHostFile("/sys/class/dmi/id/bios_version");
        version = version.substr(0, version.find('\n'));
        version.erase(version.find_last_not_of(" \t\r") + 1);
    }
    if (version.empty()) {
        Say("no instances of " + className + "\n");
        return 1;
    }
    Say(version + "\n");
    return 0;
}

}  // namespace VelkDebian
