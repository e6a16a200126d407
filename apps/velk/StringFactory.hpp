// User-visible texts by integer id. Screens hold only ids; the texts of one
// language live in one factory.
#pragma once

#include <string>

namespace Velk {

class StringFactory {
public:
    virtual ~StringFactory() = default;

    // The text with that id, owned by the factory and valid for the life of
    // the process. Unknown ids give the empty text.
    virtual const char* GetString(int id) = 0;

    // The process-wide factory. Only "en_US" exists; every locale gets it.
    static StringFactory* Get(const std::string& locale);
};

}  // namespace Velk
