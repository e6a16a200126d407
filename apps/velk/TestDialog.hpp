// "Test Management Network": up to three addresses to ping and a host name to
// resolve, pre-filled with the default gateways and name servers and the
// host's own name. Enter checks the addresses and runs the test.
#pragma once

#include <string>
#include <vector>

#include "Dialog.hpp"
#include "InputItem.hpp"
#include "ItemList.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class TestDialog : public Dialog {
public:
    explicit TestDialog(Frame* parent);
    ~TestDialog() override;

    // false on Esc (also after a test run).
    int Run() override;

    static constexpr int kPingRows = 3;
    static constexpr int kFieldLength = 30;

    // The ping rows' pre-filled texts: the candidates in order, skipping empty
    // ones, "0.0.0.0" and "::", at most kPingRows.
    static std::vector<std::string> DefaultTargets(const std::vector<std::string>& candidates);

private:
    bool StartTest();

    QelCtl::Network::DnsConfigImpl _dnsConfig;
    QelCtl::Network::RoutingInfoImpl _routingInfo;
    std::vector<InputItem*> _fields;  // owned: the ping rows, then the host name
    ItemList* _list;
};

}  // namespace Velk
