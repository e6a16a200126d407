// The screen shown while nobody is logged in: the host's identity, the
// addresses to manage it from, warnings, and the keys that lead on.
#pragma once

#include <string>
#include <vector>

#include "Frame.hpp"
#include "TextArea.hpp"
#include "hostctl/QelCtl.hpp"

namespace Velk {

class WelcomeWindow : public Frame {
public:
    WelcomeWindow();
    ~WelcomeWindow() override;

    int Run() override;
    void Update() override;

    // A line shown with the warnings until the next login (a network change
    // put back at start).
    static void SetNotice(const std::string& line);

    // The hardware line: the product alone when it already begins with the
    // vendor, otherwise "vendor product" (both with their blanks tidied).
    static std::string CombineVendorAndProduct(const std::string& vendor, const std::string& product);
    // The IPv6 lines for the given addresses: at most four, all five when there
    // are exactly five, and "..." after the fourth when there are more.
    static std::string Ipv6Lines(const std::vector<HostCtl::Network::Ipv6Network>& networks,
                                 class StringFactory& factory);

private:
    void Draw();
    void MakeStandardLayout();
    void TearDownStandardLayout();
    void Fill();
    void OnLoginKey(int key);

    QelCtl::System::SystemInfoImpl _systemInfo;
    QelCtl::Network::DnsConfigImpl _dnsConfig;

    Window* _upper = nullptr;
    Window* _lower = nullptr;
    TextArea* _title = nullptr;
    TextArea* _hardware = nullptr;
    TextArea* _processors = nullptr;
    TextArea* _network = nullptr;
    TextArea* _warning = nullptr;
    TextArea* _footer = nullptr;
    TextArea* _message = nullptr;

    // The missing-adapter alert is raised at most once per run.
    static bool _noAdapterAlertRaised;
    static std::string _notice;
};

}  // namespace Velk
