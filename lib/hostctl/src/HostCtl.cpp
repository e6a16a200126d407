// The host objects of HostCtl: each call goes to the process's backend.
#include "hostctl/HostCtl.hpp"

#include "hostctl/Backend.hpp"

namespace HostCtl {

namespace Network {

IpConfig QelNic::GetIpConfig() const { return Lib::GetBackend().GetVnicIpConfig(_name); }

void QelNic::SetIpConfig(const IpConfig& cfg) { Lib::GetBackend().SetVnicIpConfig(_name, cfg); }

ConnectionPoint QelNic::GetConnectionPoint() const { return Lib::GetBackend().GetVnicConnectionPoint(_name); }

}  // namespace Network

namespace Adv {

void AdvancedIntegerOption::SetCurrent(int64_t value) {
    Lib::AdvancedOptionValue v;
    v.isInteger = true;
    v.integer = value;
    Lib::GetBackend().SetAdvancedOption(GetName(), v);
    _current = value;
}

void AdvancedStringOption::SetCurrent(const std::string& value) {
    Lib::AdvancedOptionValue v;
    v.isInteger = false;
    v.text = value;
    Lib::GetBackend().SetAdvancedOption(GetName(), v);
    _current = value;
}

}  // namespace Adv

}  // namespace HostCtl
