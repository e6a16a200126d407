// grabCIMData of the simulated host: prints one property of a CIM class's
// instance from "/cim/<class>/<property>" of the host's state.
#include "HostCommands.hpp"

namespace VelkTools {

using HostCtl::Lib::SimState;
using nlohmann::json;

int GrabCimData(SimState& sim, const std::vector<std::string>& args, std::string& out, std::string& err) {
    if (args.size() != 2) {
        err = "grabCIMData: expected a class and a property\nusage: grabCIMData CLASS PROPERTY\n";
        return 1;
    }
    const std::string& className = args[0];
    const std::string& property = args[1];
    std::shared_ptr<const json> state = sim.Read();

    // A host without CIM data has no instances of any class.
    const json* cim = nullptr;
    if (state->contains("cim")) cim = &sim.Object(*state, "/cim");
    auto instance = cim ? cim->find(className) : json::const_iterator();
    if (!cim || instance == cim->end()) {
        out = "no instances of " + className + "\n";
        return 1;
    }
    if (!instance->is_object()) throw sim.Error("field /cim/" + className + " must be an object");
    auto value = instance->find(property);
    if (value == instance->end()) {
        err = "grabCIMData: class " + className + " has no property " + property + "\n";
        return 1;
    }
    out = (value->is_string() ? value->get<std::string>()
                              : value->dump(-1, ' ', false, json::error_handler_t::replace)) +
          "\n";
    return 0;
}

}  // namespace VelkTools
