#include "en_US_Factory.hpp"

#include <cstring>
#include <utility>

#include "hostctl/QelCtl.hpp"

namespace Velk {

namespace {

void ReadSystemVersion(char* record, size_t size) {
    QelCtl::Util::SysinfoUtil::SysinfoGet(QelCtl::Util::SysinfoNode::SystemVersion, nullptr, record, size);
}

// A NUL-terminated field of the record, never read past its width.
std::string Field(const char* record, size_t offset, size_t width) {
    return std::string(record + offset, strnlen(record + offset, width));
}

}  // namespace

en_US_Factory::en_US_Factory() : _reader(ReadSystemVersion) {}

en_US_Factory::en_US_Factory(RecordReader reader) : _reader(std::move(reader)) {}

std::string en_US_Factory::FormatHeading(const char* record) {
    return Field(record, 0, 32) + " " + Field(record, 32, 64) + " (QELKernel " + Field(record, 96, 32) +
           " Build " + Field(record, 128, 164) + ")";
}

const char* en_US_Factory::Heading() {
    if (!_headingBuilt) {
        // Built once: a record that can't be read leaves the heading empty for
        // the life of the process.
        _headingBuilt = true;
        char record[QelCtl::Util::SYSINFO_VERSION_SIZE] = {};
        try {
            _reader(record, sizeof record);
            _heading = FormatHeading(record);
        } catch (const HostCtl::Lib::HostCtlException&) {
            _heading.clear();
        }
    }
    return _heading.c_str();
}

const char* en_US_Factory::GetString(int id) {
    if (id < 0 || id > LAST_ID) return "";
    switch (id) {
        case 2:
            return Heading();
        case 3:
            return "";
        case 0:
            return "Customize System/View Logs";
        case 1:
            return "Shut Down/Restart";
        case 4:
            return "System Customization";
        case 5:
            return "Configure Password";
        case 6:
            return "Configure Lockdown Mode";
        case 7:
            return "Configure DriverVM Devices";
        case 8:
            return "Configure Management Network";
        case 9:
            return "Restart Management Network";
        case 10:
            return "Test Management Network";
        case 11:
            return "Network Restore Options";
        case 12:
            return "View Support Information";
        case 13:
            return "View System Logs";
        case 14:
            return "Troubleshooting Options";
        case 15:
            return "Reset System Configuration";
        case 16:
            return "Configure Keyboard";
        case 17:
            return "Restart Management Network: Error";
        case 18:
            return "Enable Management Network: Error";
        case 19:
            return "Disable Management Network: Error";
        case 20:
            return "Management network interface cannot be found.";
        case 21:
            return "Operation on the management network interface failed.";
        case 22:
            return "To prevent unauthorized access to this system, set the password for the user.";
        case 23:
            return "When enabled, lockdown mode prevents users from logging directly into this host. The "
                   "host will only be accessible through this local console or an authorized centralized "
                   "management application.";
        case 24:
            return "It is possible to use a Linux DriverVM to control network and storage devices. This is "
                   "recommended only for devices which Tarni does not natively support. Performance may be "
                   "compromised when compared to native Tarni drivers, but the use of a DriverVM may allow "
                   "you to utilize hardware that would not normally work with Tarni";
        case 25:
            return "To view or modify this host's management network settings in detail, press <Enter>.";
        case 26:
            return "Restarting the management network interface may be required to restore networking or to "
                   "renew a DHCP lease.\n\nRestarting the management network will result in a brief network "
                   "outage that may temporarily affect running virtual machines.\n\nNote: If a renewed DHCP "
                   "lease results in a new network identity (e.g., IP address or hostname), remote "
                   "management software will be disconnected.";
        case 27:
            return "To perform a brief network test, press <Enter>.\n\nBy default, this test will attempt to "
                   "ping the configured default gateway, ping the configured primary and alternate DNS "
                   "servers, and resolve the configured hostname.";
        case 28:
            return "To view various network restore options like full network restore, move Management "
                   "network from misconfigured kDS to standard switch or correct misconfigured kDS "
                   "Management network port properties.";
        case 29:
            return "Press the corresponding key to view a log.\nPress <Q> to return to this screen.";
        case 30:
            return "To view various troubleshooting mode options like Enable Tarni Shell, Enable SSH and "
                   "Restart Agents.";
        case 31:
            return "Warning!\n\nAll system parameters will be reverted to their software defaults, including "
                   "any parameters customized by the hardware manufacturer. The root password will be reset "
                   "to nothing, which may allow unauthorized access to your system. All virtual machines "
                   "will be unregistered.\n\nThis operation requires a restart of the host. It is "
                   "recommended to previously shut down or migrate running virtual machines off this host.";
        case 32:
            return "Warning!\n\nAll custom extensions will be removed.\n\nThis operation requires a restart "
                   "of the host. It is recommended to previously shut down or migrate running virtual "
                   "machines off this host.";
        case 33:
            return "Network identity acquired from DHCP server";
        case 34:
            return "To select the layout type for the keyboard of this host, press <Enter>.";
        case 35:
            return "Change default password to prevent unauthorized access";
        case 36:
            return "Unknown";
        case 37:
            return "IPv4 Address";
        case 38:
            return "IPv6 Addresses";
        case 39:
            return "Attributed addresses";
        case 40:
            return "Default Gateway";
        case 41:
            return "Subnet Mask";
        case 42:
            return "Hostname";
        case 43:
            return "Primary DNS Server";
        case 44:
            return "Alternate DNS Server";
        case 45:
            return "IPv6 DNS Server";
        case 46:
            return "Configure Management Network";
        case 47:
            return "DriverVM Devices";
        case 48:
            return "Network Adapters";
        case 49:
            return "VLAN (optional)";
        case 50:
            return "IPv4 Configuration";
        case 51:
            return "IPv6 Configuration";
        case 52:
            return "IPv6 is enabled.";
        case 53:
            return "IPv6 is disabled.";
        case 54:
            return "DNS Configuration";
        case 55:
            return "Custom DNS Suffixes";
        case 56:
            return "The adapters listed here provide the default network connection to and from this host. "
                   "When two or more adapters are used, connections will be fault-tolerant and outgoing "
                   "traffic will be load-balanced.";
        case 57:
            return "It is possible to use a Linux DriverVM to control network and storage devices. This is "
                   "recommended only for devices which Tarni does not natively support. Performance may be "
                   "compromised when compared to native Tarni drivers, but the use of a DriverVM may allow "
                   "you to use hardware that would not normally work with Tarni";
        case 58:
            return "A VLAN is a virtual network within a physical network. Because several VLANs can "
                   "co-exist on the same physical network segment, VLAN configuration and partitioning is "
                   "often more flexible, better isolated, and less expensive than flat networks based on "
                   "traditional physical topology.\n\nIf you are unsure how to configure or use a VLAN, it "
                   "is safe to leave this option unset.";
        case 59:
            return "This host can obtain an IPv4 address and other networking parameters automatically if "
                   "your network includes a DHCP server. If not, ask your network administrator for the "
                   "appropriate settings.";
        case 60:
            return "This host can obtain IPv6 addresses and other networking parameters automatically if "
                   "your network includes a DHCPv6 server or supports Router Advertisement.";
        case 61:
            return "This host can be configured to support IPv6. A restart of the host will be required to "
                   "enable or disable IPv6.";
        case 62:
            return "The support for IPv6 will be enabled after the next reboot.";
        case 63:
            return "If this host is configured using DHCP, DNS server addresses and other DNS parameters can "
                   "be obtained automatically. If not, ask your network administrator for the appropriate "
                   "settings.";
        case 64:
            return "When using short, unqualified names, DNS queries will attempt to locate the specified "
                   "host by appending the suffixes listed here in the order shown until a match is found or "
                   "the list is exhausted.\n\nIf no suffixes are specified here, a default suffix list is "
                   "derived from the local domain name.";
        case 65:
            return "Network Configuration Error";
        case 66:
            return "Network Restore Options";
        case 67:
            return "Restore Network Settings";
        case 68:
            return "Restore Standard Switch";
        case 69:
            return "Restore kDS";
        case 70:
            return "Restoring the network settings will revert all network configuration and will "
                   "automatically configure the network with defaults.\n\nRestoring the network settings "
                   "will stop all the running virtual machines on the host.";
        case 71:
            return "All management network and associated uplinks can be moved onto a new kSwitch in order "
                   "to restore network connectivity to Centrix. All interfaces apart from management "
                   "interface will be disabled.\nTry Restore kDS option to manually repair misconfigured "
                   "kDS.";
        case 72:
            return "Reconfigure properties of misconfigured kDS Management network port.\n\nA new kDS host "
                   "local port will be created with the reconfigured properties and the management network "
                   "will be moved to this new port. All other properties will be cloned from original "
                   "DVPort. This operation is available only for Zolva kDS";
        case 73:
            return "DriverVM Configuration";
        case 74:
            return "Select the devices from this host for which you would like to use the DriverVM. Note "
                   "only devices for which Tarni does not contain a native driver will appear below.";
        case 75:
            return "Device Assignment Warning";
        case 76:
            return "Due to the PCI topology of this system or device constraints, changes to the ownership "
                   "of this device will affect the ownership of other devices";
        case 77:
            return "Network Adapters";
        case 78:
            return "Select the adapters for this host's default management network connection. Use two or "
                   "more adapters for fault-tolerance and load-balancing.";
        case 79:
            return "Network Adapters: Warning";
        case 80:
            return "One or more of the selected adapters are already used for other connections.";
        case 81:
            return "Remove these adapters from their current connections?";
        case 82:
            return "Invalid IP address";
        case 83:
            return "Please reenter a valid IPv4 address (x.x.x.x).";
        case 84:
            return "Please reenter a valid IPv6 network address (x:x:x/x).";
        case 85:
            return "Invalid IP or IPv6 address.";
        case 86:
            return "Invalid subnet";
        case 87:
            return "Please reenter a valid subnet (x.x.x.x).";
        case 88:
            return "Invalid scope";
        case 89:
            return "Cannot add a link-local address as static address.";
        case 90:
            return "Invalid gateway address";
        case 91:
            return "Please reenter a valid gateway address (x.x.x.x).";
        case 92:
            return "Please reenter a valid IPv6 gateway address (x:x:x).";
        case 93:
            return "Link-local addresses are not supported as default gateway.";
        case 94:
            return "Invalid DNS server address";
        case 95:
            return "Please reenter a valid DNS server address (IP or IPv6).";
        case 96:
            return "Invalid VLAN ID";
        case 97:
            return "Please reenter a valid VLAN ID (1-4095).";
        case 98:
            return "You entered a VLAN ID of 4095. This host will receive all VLAN-tagged frames and be able "
                   "to send any VLAN-tagged frame.\n\nUnless this is specifically intended, it is best not "
                   "to configure a VLAN ID of 4095.";
        case 99:
            return "If you are unsure how to configure or use a VLAN, it is safe to leave this option unset.";
        case 100:
            return "VLAN ID (1-4094, or 4095 to access all VLANs):";
        case 101:
            return "IPv4 Configuration";
        case 102:
            return "This host can obtain network settings automatically if your network includes a DHCP "
                   "server. If it does not, the following settings must be specified:";
        case 103:
            return "Disable IPv4 configuration for management network";
        case 104:
            return "Use dynamic IPv4 address and network configuration";
        case 105:
            return "Set static IPv4 address and network configuration:";
        case 106:
            return "IPv6 Configuration";
        case 107:
            return "This host can obtain network settings automatically if your network supports Stateless "
                   "Address Autoconfiguration (SLAAC) or includes a DHCPv6 server. If it does not, static "
                   "settings must be specified:";
        case 108:
            return "Disable IPv6 (restart required)";
        case 109:
            return "Use dynamic IPv6 address and network configuration";
        case 110:
            return "Use DHCPv6";
        case 111:
            return "Set static IPv6 address and network configuration";
        case 112:
            return "Static address";
        case 113:
            return "Default gateway";
        case 114:
            return "Warning";
        case 115:
            return "No adapter";
        case 116:
            return "Automatic";
        case 117:
            return "None";
        case 118:
            return "Manual";
        case 119:
            return "Set";
        case 120:
            return "Not set";
        case 121:
            return "Enabled";
        case 122:
            return "Disabled";
        case 123:
            return "Done.";
        case 124:
            return "DNS Configuration";
        case 125:
            return "This host can only obtain DNS settings automatically if it also obtains its IP "
                   "configuration automatically.";
        case 126:
            return "Obtain DNS server addresses and a hostname automatically";
        case 127:
            return "Use the following DNS server addresses and hostname:";
        case 128:
            return "DNS queries will attempt to locate hosts by appending the suffixes specified here to "
                   "short, unqualified names.\n\nUse spaces or commas to separate multiple entries.";
        case 129:
            return "Suffixes:";
        case 130:
            return "Restart Management Network: Confirm";
        case 131:
            return "Restarting the management network will result in a brief network outage. It may "
                   "disconnect remote management software and affect running virtual machines.";
        case 132:
            return "Restart management network now?";
        case 133:
            return "Restart Management Network";
        case 134:
            return "Please wait while the management network restarts.";
        case 135:
            return "Stopping management network.";
        case 136:
            return "Starting management network.";
        case 137:
            return "IP address is ";
        case 138:
            return "Restore Standard Switch";
        case 139:
            return "All management network and associated uplinks can be moved onto a new kSwitch in order "
                   "to restore network connectivity to Centrix.";
        case 140:
            return "Move the management network onto a standard switch?";
        case 141:
            return "Download tools to manage this host from:";
        case 142:
            return "Warning: DHCP lookup failed. You may be unable to access this system until you customize "
                   "its network configuration.";
        case 143:
            return "Warning: Host is running in audit mode. Your configuration will not be persistent across "
                   "reboots. Please contact support.";
        case 144:
            return "Authentication Required";
        case 145:
            return "Enter an authorized login name and password for ";
        case 146:
            return "Enter the smart card login PIN for ";
        case 147:
            return "Authentication Denied";
        case 148:
            return "Direct console access has been disabled by the administrator for ";
        case 149:
            return "Login Name:";
        case 150:
            return "Login Id:";
        case 151:
            return "Password:";
        case 152:
            return "PIN:";
        case 153:
            return "Authentication failed";
        case 154:
            return "Invalid login or password.";
        case 155:
            return "User does not have permission to login to VELK.";
        case 156:
            return "Configure Password";
        case 157:
            return "Setting the password will prevent unauthorized access to this host.";
        case 158:
            return "Old Password:";
        case 159:
            return "New Password:";
        case 160:
            return "Confirm Password:";
        case 161:
            return "Configure Password: Error";
        case 162:
            return "Configure Password: Warning";
        case 163:
            return "The old password you entered is incorrect";
        case 164:
            return "The new password and the confirmed password do not match.";
        case 165:
            return "Empty passwords are not allowed.";
        case 166:
            return "New password is same as old password. Are you sure?";
        case 167:
            return "The password change operation failed.\nPlease ensure that your password meets the "
                   "complexity criteria set by the system.";
        case 168:
            return "Shut Down/Restart";
        case 169:
            return "Remote management software is recommended to safely shut down or restart this "
                   "host.\n\nBy default, running virtual machines will be powered off, suspended, or shut "
                   "down according to the current system shutdown policy.\nIf this host is part of an HA "
                   "cluster, then HA will not restart these VMs unless they are forcefully terminated.";
        case 170:
            return "Forcefully terminate running VMs";
        case 171:
            return "Shut Down Host";
        case 172:
            return "Shutdown in progress...";
        case 173:
            return "Warning: VMs running on the host";
        case 174:
            return "Host has VMs running. Are you sure you want to shutdown/restart the host or restore the "
                   "network.";
        case 175:
            return "Restart Host";
        case 176:
            return "Restart in progress...";
        case 177:
            return "Reset System Configuration: Confirm";
        case 178:
            return "Warning! All system parameters will be reverted to their software defaults, and host "
                   "configuration will be lost.";
        case 179:
            return "Reset System Configuration now?";
        case 180:
            return "Reset System Configuration";
        case 181:
            return "Please wait while the default settings are restored.";
        case 182:
            return "Default settings are restored. Press <Enter> to restart your host.";
        case 183:
            return "Remove Custom Extensions: Confirm";
        case 184:
            return "Warning! All custom extensions will be removed.";
        case 185:
            return "Remove custom extensions now?";
        case 186:
            return "Remove Custom Extensions";
        case 187:
            return "Please wait while the custom extensions are removed.";
        case 188:
            return "Custom extensions have been removed. Press <Enter> to restart your host.";
        case 189:
            return "Restore Network Factory Settings";
        case 190:
            return "This option will reset the host network configuration to its default setting.";
        case 191:
            return "Are you sure you want to reset the host network configuration?";
        case 192:
            return "Restore to default blocked setting (unblocked) ";
        case 193:
            return "Select kDS uplinks";
        case 194:
            return "Please enter a valid VLAN ID (1-4094).";
        case 195:
            return "Restore kDS";
        case 196:
            return "Enter the properties for new kDS host local port that will be created.\nAll other "
                   "properties will be taken as default.";
        case 197:
            return "Restore kDS: Error";
        case 198:
            return "Unable to restore kDS. Check logs for details.";
        case 199:
            return "Unable to restore kDS. Restore kDS operation cannot be performed on 3rd party kDS.";
        case 200:
            return "kDS Uplinks";
        case 201:
            return "Select the kDS Uplinks (one or more) to be used by management qelnic";
        case 202:
            return "kDS Uplinks: Warning";
        case 203:
            return "No uplinks were selected.";
        case 204:
            return "Do you want to continue?";
        case 205:
            return "No kDS Uplinks: Error";
        case 206:
            return "No uplinks are configured on the host for this kDS.";
        case 207:
            return "Restore Network Settings";
        case 208:
            return "Please wait while the factory network settings are restored.";
        case 209:
            return "Powering Off VMs.";
        case 210:
            return "Auto-configuring network.";
        case 211:
            return "Configure Management Network: Confirm";
        case 212:
            return "You have made changes to the host's management network.\nApplying these changes may "
                   "result in a brief network outage, disconnect remote management software and affect "
                   "running virtual machines. In case IPv6 has been enabled or disabled this will restart "
                   "your host.";
        case 213:
            return "Apply changes and restart management network?";
        case 214:
            return "Apply changes and reboot host?";
        case 215:
            return "Test Management Network";
        case 216:
            return "By default, this test will attempt to ping your default gateway and DNS servers, and "
                   "resolve your hostname.";
        case 217:
            return "Ping Address";
        case 218:
            return "Resolve Hostname";
        case 219:
            return "Testing Management Network";
        case 220:
            return "You may interrupt the test at any time.";
        case 221:
            return "Pinging address";
        case 222:
            return "Resolving hostname";
        case 223:
            return "Failed.";
        case 224:
            return "OK.";
        case 225:
            return "Troubleshooting Mode Options";
        case 226:
            return "Enable Tarni Shell";
        case 227:
            return "Disable Tarni Shell";
        case 228:
            return "Enable SSH";
        case 229:
            return "Disable SSH";
        case 230:
            return "Tarni Shell";
        case 231:
            return "SSH Support";
        case 232:
            return "Modify Tarni Shell and SSH timeouts";
        case 233:
            return "Modify VELK idle timeout";
        case 234:
            return "Restart Management Agents";
        case 235:
            return "Change current state of the Tarni Shell";
        case 236:
            return "Change current state of SSH";
        case 237:
            return "Tarni Shell is Enabled";
        case 238:
            return "Tarni Shell is Disabled";
        case 239:
            return "SSH is Enabled";
        case 240:
            return "SSH is Disabled";
        case 241:
            return "The management agents are the programs that allow remote management software to monitor "
                   "and control this host.\n\nRestarting the management agents will disconnect all remote "
                   "management software and will affect all running services.";
        case 242:
            return "Modify the number of minutes that can elapse before you must log in after Tarni Shell "
                   "access is enabled and the idle timeout for interactive sessions.";
        case 243:
            return "Modify the number of idle minutes that can elapse before you must log in again in VELK.";
        case 244:
            return "Restart Management Agents: Confirm";
        case 245:
            return "{color:red}Warning! Restarting the management agents will disconnect all remote "
                   "management software. This will affect all running services.\nCollection of extra "
                   "troubleshooting information can take a noticeable amount of time.{/color}";
        case 246:
            return "Restart management agents now?";
        case 247:
            return "Stopping management agents.";
        case 248:
            return "Starting management agents.";
        case 249:
            return "Collect extra troubleshooting information";
        case 250:
            return "Collecting host agent live core information.";
        case 251:
            return "Please, wait ...";
        case 252:
            return "Configure Lockdown Mode";
        case 253:
            return "When enabled, lockdown mode prevents users from logging directly into this host.";
        case 254:
            return "Enable lockdown mode";
        case 255:
            return "If you are having difficulty using your keyboard, choose a layout that matches your "
                   "keyboard from the options below.";
        case 256:
            return "Enable IPv6: Restart Required";
        case 257:
            return "This host must be restarted before IPv6 will be enabled.";
        case 258:
            return "Disable IPv6: Restart Required";
        case 259:
            return "This host must be restarted before IPv6 will be disabled.";
        case 260:
            return "Router advertised";
        case 261:
            return "DHCP";
        case 262:
            return "STATIC";
        case 263:
            return "AUTOCONF";
        case 264:
            return "Waiting for DHCP...";
        case 265:
            return "Set the timeouts for Tarni Shell access (local and remote)";
        case 266:
            return "Set the number of minutes that can elapse before you must log in after Tarni Shell is "
                   "enabled (the availability timeout) and the timeout for idle interactive "
                   "sessions.\n\nAfter the availability timeout expires any running shell instances will "
                   "remain, but new sessions will not be allowed.  Changes to idle timeout will apply on "
                   "next login, but will not affect any existing sessions.\n\nValues are in minutes. Use "
                   "zero to disable timeouts. Maximum value is 1440 minutes.";
        case 267:
            return "Availability timeout";
        case 268:
            return "Idle timeout";
        case 269:
            return "Invalid timeout value";
        case 270:
            return "Timeout value must be between 0 (disabled) and 1440 minutes";
        case 271:
            return "Set idle timeout for VELK access";
        case 272:
            return "Set the number of idle minutes that can elapse before you must log in again in "
                   "VELK.\n\nValue is in minutes. Use zero to disable the timeout. Maximum value is 1440 "
                   "minutes.";
        case 273:
            return "VELK idle timeout";
        case 274:
            return "Reading the management network.";
        case 275:
            return "Creating standard switch ";
        case 276:
            return "Adding port group ";
        case 277:
            return "Moving uplink ";
        case 278:
            return "Moving management interface ";
        case 279:
            return "Disabling other interfaces.";
        case 280:
            return "Undoing the steps already done.";
        case 281:
            return "Creating host local port on ";
        case 282:
            return "VLAN ID (1-4094, empty for none):";
        case 283:
            return "No adapter is selected. Select at least one adapter for the management network.";
        case 284:
            return "Management network checked: the change is kept.";
        case 285:
            return "Check Management Network";
        case 286:
            return "The management network failed a check after the change. The host may no longer be "
                   "reachable over the network.";
        case 287:
            return "Passed";
        case 288:
            return "Failed";
        case 289:
            return "Warning";
        case 290:
            return "The previous configuration is put back in";
        case 291:
            return "seconds (any key restarts the count).";
        case 292:
            return "Keep Change";
        case 293:
            return "Revert Now";
        case 294:
            return "Management network checked: the previous configuration is back.";
        case 295:
            return "The previous configuration is back, but it failed a check too. Restoring the factory "
                   "network settings may bring the host back on the network.";
        case 296:
            return "Restore Factory Settings";
        case 297:
            return "Leave As Is";
        case 298:
            return "A network change left unfinished was reverted at start.";
        case 299:
            return "The network configuration could not be saved; nothing was changed.";
        case 300:
            return "The previous network configuration could not be put back.";
        case 301:
            return "The IPv4 address is already in use on the management network; nothing was changed.";
        case 302:
            return "Management network: the change is kept although a check failed.";
        case 303:
            return "Checking the management network.";
        case 304:
            return "The management network could not be probed for another machine using the IPv4 address. "
                   "The change is applied and checked afterwards.";
        default:
            return "";
    }
}

}  // namespace Velk
