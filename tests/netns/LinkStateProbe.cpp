// Prints the network snapshot of the namespace it runs in as JSON, for the
// namespace tests to compare with what `ip -json` shows. Exit status 1 with
// the error on standard error when the snapshot cannot be read.
#include <cstdio>
#include <exception>
#include <nlohmann/json.hpp>

#include "linux/LinkState.hpp"

int main() {
    using namespace HostCtl::Lib::Linux;
    try {
        const NetworkSnapshot snapshot = ReadNetwork();
        nlohmann::json out = {{"links", nlohmann::json::array()},
                              {"addresses", nlohmann::json::array()},
                              {"routes", nlohmann::json::array()}};
        for (const LinkInfo& l : snapshot.links) {
            const LinkInfo* master = snapshot.FindLink(l.masterIndex);
            const LinkInfo* parent = snapshot.FindLink(l.parentIndex);
            out["links"].push_back({{"index", l.index},
                                    {"name", l.name},
                                    {"kind", l.kind},
                                    {"mac", l.mac},
                                    {"adminUp", l.adminUp},
                                    {"carrier", l.carrier},
                                    {"master", master != nullptr ? master->name : ""},
                                    {"parent", parent != nullptr ? parent->name : ""},
                                    {"vlanId", l.vlanId},
                                    {"hasDevice", l.hasDevice},
                                    {"driver", l.driver},
                                    {"speedMbps", l.speedMbps},
                                    {"duplex", l.duplex},
                                    {"bondPrimary", l.bondPrimary},
                                    {"bondMode", l.bondMode},
                                    {"description", l.description},
                                    {"label", l.label}});
        }
        for (const AddressInfo& a : snapshot.addresses) {
            const LinkInfo* link = snapshot.FindLink(a.linkIndex);
            out["addresses"].push_back({{"link", link != nullptr ? link->name : ""},
                                        {"ipv6", a.ipv6},
                                        {"address", a.address},
                                        {"prefixLength", a.prefixLength},
                                        {"flags", a.flags},
                                        {"permanent", a.Permanent()},
                                        {"tentative", a.Tentative()},
                                        {"dadFailed", a.DadFailed()},
                                        {"validLifetime", a.validLifetime},
                                        {"preferredLifetime", a.preferredLifetime},
                                        {"proto", a.proto}});
        }
        auto route = [&](const RouteInfo& r) {
            const LinkInfo* link = snapshot.FindLink(r.linkIndex);
            return nlohmann::json{{"ipv6", r.ipv6},
                                  {"destination", r.destination},
                                  {"prefixLength", r.prefixLength},
                                  {"gateway", r.gateway},
                                  {"link", link != nullptr ? link->name : ""},
                                  {"protocol", r.protocol},
                                  {"metric", r.metric}};
        };
        for (const RouteInfo& r : snapshot.routes) out["routes"].push_back(route(r));
        for (bool ipv6 : {false, true})
            if (const auto r = snapshot.DefaultRoute(ipv6)) out[ipv6 ? "default6" : "default4"] = route(*r);
        std::puts(out.dump(1).c_str());
        return 0;
    } catch (const std::exception& e) {
        std::fprintf(stderr, "%s\n", e.what());
        return 1;
    }
}
