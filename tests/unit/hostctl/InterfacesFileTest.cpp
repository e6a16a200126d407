// The lossless editor of the interfaces files: realistic files print back
// byte for byte and read as ifupdown reads them, edits change only their own
// lines, and source lines are followed to the file that defines a stanza.
#include <sys/stat.h>

#include <functional>

#include "TestSupport.hpp"
#include "linux/InterfacesFile.hpp"
#include "linux/NetworkApply.hpp"

namespace {

using namespace HostCtlTest;
using HostCtl::Lib::InterfacesFile;
using HostCtl::Lib::InterfacesFiles;

// A Debian host with libvirt: the address on br0, its port the NIC.
const std::string DEBIAN =
    "# This file describes the network interfaces available on your system\n"
    "# and how to activate them. For more information, see interfaces(5).\n"
    "\n"
    "source /etc/network/interfaces.d/*\n"
    "\n"
    "# The loopback network interface\n"
    "auto lo\n"
    "iface lo inet loopback\n"
    "\n"
    "allow-hotplug eno1\n"
    "iface eno1 inet manual\n"
    "\n"
    "auto br0\n"
    "iface br0 inet static\n"
    "\taddress 192.0.2.10/24\n"
    "\tgateway 192.0.2.1\n"
    "\t# the bridge\n"
    "\tbridge_ports eno1\n"
    "\tbridge_stp off\n"
    "\n"
    "\tbridge_fd 0\n"
    "\tdns-nameservers 192.0.2.53\n";

// A host laid out for ifupdown2: vmbr0 with both families, vmbr1 without one.
const std::string VMBR =
    "auto lo\n"
    "iface lo inet loopback\n"
    "\n"
    "iface eno1 inet manual\n"
    "\n"
    "auto vmbr0\n"
    "iface vmbr0 inet static\n"
    "        address 192.0.2.10/24\n"
    "        gateway 192.0.2.1\n"
    "        bridge-ports eno1\n"
    "        bridge-stp off\n"
    "        bridge-fd 0\n"
    "        bridge-ports-condone-regex ^(tap|veth|fwpr)\n"
    "\n"
    "auto vmbr1\n"
    "iface vmbr1\n"
    "        bridge-ports none\n"
    "        bridge-stp off\n"
    "\n"
    "source /etc/network/interfaces.d/*\n";

// CRLF line ends, no final line end, capitalised names, a continuation line,
// a mapping and a rename.
const std::string CRLF =
    "rename eth9=eth0\r\n"
    "mapping eth1\r\n"
    "  script /usr/local/sbin/map-scheme\r\n"
    "iface eth0 inet static\r\n"
    "    Address 198.51.100.7/24\r\n"
    "    bridge-ports eno1\\\r\n"
    "      eno2\r\n"
    "    GATEWAY 198.51.100.1";

TEST(InterfacesFileTest, PrintsTheInputAndReadsOptions) {
    struct Row {
        std::string text, name;
        std::optional<std::string> family;
        std::string option;
        std::optional<std::string> value;
    };
    const Row rows[] = {
        {DEBIAN, "br0", "inet", "bridge-ports", "eno1"},
        {DEBIAN, "br0", "inet", "DNS_Nameservers", "192.0.2.53"},  // after a blank line in the stanza
        {VMBR, "vmbr0", "inet", "bridge_ports_condone_regex", "^(tap|veth|fwpr)"},
        {VMBR, "vmbr1", "", "bridge-ports", "none"},
        {VMBR, "vmbr1", "inet", "bridge-ports", std::nullopt},
        {CRLF, "eth0", std::nullopt, "address", "198.51.100.7/24"},
        {CRLF, "eth0", "inet", "bridge_ports", "eno1      eno2"},
        {CRLF, "eth0", "inet", "gateway", "198.51.100.1"},
        {"iface eth0 inet\n\taddress 192.0.2.7/24 \\\n", "eth0", "inet", "address", "192.0.2.7/24"},
        {"iface\tx\\\n inet static\n  mtu\t1500 \t\n", "x", "inet", "MTU", "1500"},
        // Not understood, kept: binary bytes, options outside a stanza, a
        // comment whose backslash joins nothing.
        {std::string("\0\xff\\\n\r\r\n  mtu 1500\n#\\\niface \x80 inet\n\\", 35), "x", std::nullopt, "mtu",
         std::nullopt},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.text);
        const InterfacesFile file(row.text);
        EXPECT_EQ(file.Print(), row.text);
        const std::vector<size_t> found = file.FindIface(row.name, row.family);
        ASSERT_EQ(found.size(), row.value ? 1u : found.size());
        std::optional<std::string> value;
        if (!found.empty()) value = file.Option(found[0], row.option);
        EXPECT_EQ(value, row.value);
    }

    const InterfacesFile crlf(CRLF);
    ASSERT_EQ(crlf.Stanzas().size(), 3u);
    EXPECT_EQ(crlf.Stanzas()[1].keyword, "mapping");
    const std::vector<std::pair<std::string, std::string>> options = {
        {"Address", "198.51.100.7/24"}, {"bridge-ports", "eno1      eno2"}, {"GATEWAY", "198.51.100.1"}};
    EXPECT_EQ(crlf.Options(2), options);
}

TEST(InterfacesFileTest, EditsChangeOnlyTheirLines) {
    using Edit = std::function<void(InterfacesFile&)>;
    auto stanza = [](const InterfacesFile& f, const std::string& name, const std::string& family) {
        return f.FindIface(name, family).at(0);
    };
    struct Row {
        std::string text;
        Edit edit;
        std::string expected;
    };
    const Row rows[] = {
        {VMBR,
         [&](InterfacesFile& f) { f.SetOption(stanza(f, "vmbr0", "inet"), "address", "192.0.2.20/24"); },
         [] {
             std::string t = VMBR;
             return t.replace(t.find("192.0.2.10/24"), 13, "192.0.2.20/24");
         }()},
        // Static to DHCP: the method and the address lines change, the
        // comment between the options stays.
        {DEBIAN,
         [&](InterfacesFile& f) {
             const size_t s = stanza(f, "br0", "inet");
             f.SetMethod(s, "dhcp");
             f.RemoveOption(s, "address");
             f.RemoveOption(s, "gateway");
         },
         DEBIAN.substr(0, DEBIAN.find("iface br0")) + "iface br0 inet dhcp\n"
                                                      "\t# the bridge\n"
                                                      "\tbridge_ports eno1\n"
                                                      "\tbridge_stp off\n"
                                                      "\n"
                                                      "\tbridge_fd 0\n"
                                                      "\tdns-nameservers 192.0.2.53\n"},
        // DHCP to static: new lines after the last option, indented alike.
        {"iface vmbr0 inet dhcp\n"
         "    bridge-ports eno1\n"
         "    bridge-stp off\n"
         "# eno2 is spare\n"
         "\n"
         "iface eno2 inet manual\n",
         [&](InterfacesFile& f) {
             const size_t s = stanza(f, "vmbr0", "inet");
             f.SetMethod(s, "static");
             f.SetOption(s, "address", "192.0.2.10/24");
             f.SetOption(s, "gateway", "192.0.2.1");
         },
         "iface vmbr0 inet static\n"
         "    bridge-ports eno1\n"
         "    bridge-stp off\n"
         "    address 192.0.2.10/24\n"
         "    gateway 192.0.2.1\n"
         "# eno2 is spare\n"
         "\n"
         "iface eno2 inet manual\n"},
        // A new inet6 stanza after vmbr0's, then removed again.
        {VMBR,
         [](InterfacesFile& f) {
             const size_t s = f.AddIface("vmbr0", "inet6", "static", {{"address", "2001:db8::10/64"}});
             EXPECT_EQ(f.Stanzas()[s].Family(), "inet6");
             EXPECT_EQ(f.Option(s, "address"), "2001:db8::10/64");
         },
         [] {
             std::string t = VMBR;
             return t.insert(t.find("\nauto vmbr1"),
                             "\niface vmbr0 inet6 static\n        address 2001:db8::10/64\n");
         }()},
        {VMBR, [](InterfacesFile& f) { f.RemoveStanza(f.AddIface("vmbr0", "inet6", "auto")); }, VMBR},
        // An indented comment after the options stays with its stanza.
        {"iface vmbr0 inet static\n\taddress 192.0.2.10/24\n\t# VM ports come and go\n# next\n",
         [](InterfacesFile& f) { f.AddIface("vmbr0", "inet6", "auto"); },
         "iface vmbr0 inet static\n\taddress 192.0.2.10/24\n\t# VM ports come and go\n\niface vmbr0 inet6 "
         "auto\n"
         "# next\n"},
        // Capitalised and repeated names, a continuation line, CRLF and no
        // final line end, a stanza with no options and one without a method.
        {CRLF,
         [&](InterfacesFile& f) {
             const size_t s = stanza(f, "eth0", "inet");
             f.SetOption(s, "address", "198.51.100.9/24");
             f.SetOption(s, "bridge_ports", "eno3");
             f.SetOption(s, "mtu", "9000");
         },
         "rename eth9=eth0\r\n"
         "mapping eth1\r\n"
         "  script /usr/local/sbin/map-scheme\r\n"
         "iface eth0 inet static\r\n"
         "    Address 198.51.100.9/24\r\n"
         "    bridge-ports eno3\r\n"
         "    GATEWAY 198.51.100.1\r\n"
         "    mtu 9000"},
        {"iface eth0 inet static\n\taddress 192.0.2.7/24\n\taddress 192.0.2.8/24",
         [&](InterfacesFile& f) { f.RemoveOption(stanza(f, "eth0", "inet"), "address"); },
         "iface eth0 inet static"},
        {"iface eth0 inet static\n\taddress 192.0.2.7/24\n\tADDRESS 192.0.2.8/24\n",
         [&](InterfacesFile& f) { f.SetOption(stanza(f, "eth0", "inet"), "address", "192.0.2.9/24"); },
         "iface eth0 inet static\n\taddress 192.0.2.9/24\n"},
        {"iface eno1  inet  manual  # x\n\niface eno2 inet \\",
         [&](InterfacesFile& f) {
             f.SetOption(stanza(f, "eno1", "inet"), "mtu", "9000");
             f.SetMethod(stanza(f, "eno1", "inet"), "static");
             f.SetMethod(stanza(f, "eno2", "inet"), "manual");
             f.SetOption(stanza(f, "eno2", "inet"), "mtu", "1500");
         },
         "iface eno1  inet  static  # x\n\tmtu 9000\n\niface eno2 inet manual \\\n\n\tmtu 1500"},
        // At the end of a file without a stanza of the interface.
        {"auto lo\niface lo inet loopback",
         [](InterfacesFile& f) {
             f.AddIface("vmbr0", "inet", "static", {{"address", "192.0.2.10/24"}});
         },
         "auto lo\niface lo inet loopback\n\niface vmbr0 inet static\n\taddress 192.0.2.10/24"},
        {"", [](InterfacesFile& f) { f.AddIface("vmbr1", "", ""); }, "iface vmbr1\n"},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.text);
        InterfacesFile file(row.text);
        row.edit(file);
        EXPECT_EQ(file.Print(), row.expected);
        EXPECT_EQ(InterfacesFile(file.Print()).Stanzas().size(), file.Stanzas().size());
    }
}

TEST(InterfacesFileTest, EditsThatWouldBreakTheFileAreRefused) {
    using Edit = std::function<void(InterfacesFile&)>;
    const Edit edits[] = {
        [](InterfacesFile& f) { f.SetMethod(f.FindIface("vmbr1").at(0), "static"); },  // no family
        [](InterfacesFile& f) { f.SetOption(0, "address", "192.0.2.1/24"); },          // an auto line
        [](InterfacesFile& f) { f.SetOption(6, "address", "192.0.2.1/24\n\tgateway x"); },
        [](InterfacesFile& f) { f.SetOption(6, "address", "192.0.2.1/24 \\"); },
        [](InterfacesFile& f) { f.SetOption(6, "address", " "); },
        [](InterfacesFile& f) { f.SetOption(6, "iface", "x"); },
        [](InterfacesFile& f) { f.SetOption(6, "up ip", "x"); },
        [](InterfacesFile& f) { f.SetMethod(6, "static\r"); },
        [](InterfacesFile& f) { f.AddIface("vmbr2", "", "static"); },
        [](InterfacesFile& f) { f.RemoveStanza(99); },
    };
    for (const Edit& edit : edits) {
        InterfacesFile file(VMBR);
        EXPECT_THROW(edit(file), HostCtlException);
        EXPECT_EQ(file.Print(), VMBR);
    }
}

// Source lines are followed from /etc/network/interfaces: globs, relative
// paths, source-directory's names, loops and missing files.
class InterfacesFilesTest : public SimHostTest {
protected:
    void Put(const std::string& path, const std::string& text) {
        std::filesystem::create_directories(std::filesystem::path(Root() + path).parent_path());
        WriteFile(Root() + path, text);
    }
};

TEST_F(InterfacesFilesTest, FindsTheStanzaWhereItIsAndEditsThatFile) {
    Put("/etc/network/interfaces",
        "auto lo\niface lo inet loopback\n\n"
        "source interfaces.d/*\n"
        "source /etc/network/missing\n"
        "source-directory /etc/network/more\n"
        "source /etc/network/interfaces\n"
        "\niface vmbr0 inet6 auto\n");
    Put("/etc/network/interfaces.d/vmbr0",
        "source ../interfaces.d/vmbr0\n"
        "auto vmbr0\n"
        "iface vmbr0 inet static\n"
        "    address 192.0.2.10/24\n"
        "    bridge-ports eno1\n");
    Put("/etc/network/more/eno1", "iface eno1 inet manual\n");
    Put("/etc/network/more/vmbr0.cfg", "iface vmbr0 inet dhcp\n");  // a name source-directory skips
    chmod((Root() + "/etc/network/interfaces.d/vmbr0").c_str(), 0640);

    InterfacesFiles config;
    std::vector<std::string> paths;
    for (const InterfacesFiles::File& f : config.Files()) paths.push_back(f.path);
    EXPECT_EQ(paths, (std::vector<std::string>{"/etc/network/interfaces", "/etc/network/interfaces.d/vmbr0",
                                               "/etc/network/more/eno1"}));
    const std::vector<InterfacesFiles::Place> found = config.FindIface("vmbr0");
    ASSERT_EQ(found.size(), 2u);
    EXPECT_EQ(found[0].file, 1u);
    EXPECT_EQ(found[1].file, 0u);
    EXPECT_EQ(config.FindIface("eno1").at(0).file, 2u);
    EXPECT_TRUE(config.Changes().empty());

    const InterfacesFiles::Place inet = config.FindIface("vmbr0", "inet").at(0);
    config.Files()[inet.file].file.SetOption(inet.stanza, "address", "192.0.2.20/24");
    const std::vector<InterfacesFiles::Change> changes = config.Changes();
    ASSERT_EQ(changes.size(), 1u);
    EXPECT_EQ(changes[0].path, "/etc/network/interfaces.d/vmbr0");
    EXPECT_EQ(changes[0].mode, 0640u);
    EXPECT_EQ(changes[0].text,
              "source ../interfaces.d/vmbr0\nauto vmbr0\niface vmbr0 inet static\n"
              "    address 192.0.2.20/24\n    bridge-ports eno1\n");

    std::filesystem::remove(Root() + "/etc/network/interfaces");
    EXPECT_TRUE(InterfacesFiles().Files().empty());
}

// A change of the management interface edits only the options Velk owns in
// its stanzas (and makes every bridge keep its VM ports on ifupdown2).
TEST_F(InterfacesFilesTest, ManagementChangesEditOnlyOwnedOptions) {
    using HostCtl::Lib::Linux::Engine;
    using HostCtl::Lib::Linux::PendingChange;
    using HostCtl::Network::IpConfig;
    using HostCtl::Network::Ipv4Address;
    using HostCtl::Network::Ipv6Network;
    auto ip = [](const std::string& v4, const std::string& v6 = "", bool ra = false) {
        IpConfig c;
        if (v4 == "dhcp")
            c.SetUseDhcp(true);
        else
            c.SetUseDhcp(false, false, Ipv4Address(v4), Ipv4Address("255.255.255.0"));
        if (!v6.empty()) c.SetIpv6Network({Ipv6Network(v6)});
        c.SetUseIpv6RouterAdvertised(ra);
        return c;
    };
    const std::string head = "auto lo\niface lo inet loopback\n\nauto vmbr0\n";
    struct Row {
        const char* what;
        Engine engine;
        std::string before;
        std::function<void(PendingChange&)> change;
        std::string after;  // "" when the change is refused
    } rows[] = {
        {"static address, gateway kept", Engine::Ifupdown,
         head + "iface vmbr0 inet static\n\taddress 192.0.2.10\n\tnetmask 255.255.255.0 # old style\n"
                "\tgateway 192.0.2.1\n\tbridge-ports eno1 # the NIC\n",
         [&](PendingChange& c) { c.ip = ip("192.0.2.20"); },
         head + "iface vmbr0 inet static\n\taddress 192.0.2.20/24\n\tgateway 192.0.2.1\n"
                "\tbridge-ports eno1 # the NIC\n"},
        {"DHCP drops the static options", Engine::Ifupdown,
         head +
             "iface vmbr0 inet static\n    address 192.0.2.10/24\n    gateway 192.0.2.1\n    bridge-fd 0\n",
         [&](PendingChange& c) { c.ip = ip("dhcp"); }, head + "iface vmbr0 inet dhcp\n    bridge-fd 0\n"},
        {"static from DHCP with a gateway", Engine::Ifupdown,
         head + "iface vmbr0 inet dhcp\n    bridge-fd 0\n",
         [&](PendingChange& c) {
             c.ip = ip("192.0.2.20");
             c.gateway4 = "192.0.2.1";
         },
         head +
             "iface vmbr0 inet static\n    bridge-fd 0\n    address 192.0.2.20/24\n    gateway 192.0.2.1\n"},
        {"SLAAC on ifupdown: inet6 auto", Engine::Ifupdown, head + "iface vmbr0 inet dhcp\n",
         [&](PendingChange& c) { c.ip = ip("dhcp", "", true); },
         head + "iface vmbr0 inet dhcp\n\niface vmbr0 inet6 auto\n"},
        {"static IPv6 with SLAAC on ifupdown2; both bridges keep VM ports", Engine::Ifupdown2,
         head +
             "iface vmbr0 inet dhcp\n\tbridge-ports eno1\n\nauto vmbr1\niface vmbr1\n\tbridge-ports none\n",
         [&](PendingChange& c) { c.ip = ip("dhcp", "2001:db8:1::10/64", true); },
         head + "iface vmbr0 inet dhcp\n\tbridge-ports eno1\n\tbridge-ports-condone-regex "
                "^(tap|veth|fwpr|vnet)\n"
                "\niface vmbr0 inet6 static\n\taddress 2001:db8:1::10/64\n\taccept_ra 2\n\tautoconf 1\n"
                "\nauto vmbr1\niface vmbr1\n\tbridge-ports none\n\tbridge-ports-condone-regex "
                "^(tap|veth|fwpr|vnet)\n"},
        {"uplinks of a bond port", Engine::Ifupdown,
         head + "iface vmbr0 inet dhcp\n\tbridge-ports bond0\n\nauto bond0\niface bond0 inet manual\n"
                "\tbond-slaves eno1 eno2\n\tbond-primary eno1\n",
         [&](PendingChange& c) {
             c.uplinks = {"eno2", "eno1"};
             c.primary = "eno2";
         },
         head + "iface vmbr0 inet dhcp\n\tbridge-ports bond0\n\nauto bond0\niface bond0 inet manual\n"
                "\tbond-slaves eno2 eno1\n\tbond-primary eno2\n"},
        {"DHCP on a stanza without a family is refused", Engine::Ifupdown2,
         head + "iface vmbr0\n\taddress 192.0.2.10/24\n", [&](PendingChange& c) { c.ip = ip("dhcp"); }, ""},
        {"a gateway without a static address is refused", Engine::Ifupdown, head + "iface vmbr0 inet dhcp\n",
         [&](PendingChange& c) { c.gateway4 = "192.0.2.1"; }, ""},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.what);
        Put("/etc/network/interfaces", row.before);
        InterfacesFiles files;
        PendingChange change;
        change.iface = "vmbr0";
        row.change(change);
        if (row.after.empty()) {
            EXPECT_THROW(HostCtl::Lib::Linux::EditForChange(files, change, row.engine), HostCtlException);
            continue;
        }
        HostCtl::Lib::Linux::EditForChange(files, change, row.engine);
        EXPECT_EQ(files.Files().at(0).file.Print(), row.after);
    }
}

}  // namespace
