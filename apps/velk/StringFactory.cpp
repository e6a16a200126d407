#include "StringFactory.hpp"

#include "en_US_Factory.hpp"

namespace Velk {

StringFactory* StringFactory::Get(const std::string& /*locale*/) {
    static en_US_Factory factory;
    return &factory;
}

}  // namespace Velk
