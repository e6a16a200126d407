// Reading and editing a JSON document by JSON pointer ("/network/vnics/0/name";
// "~1" stands for "/" and "~0" for "~" inside a name), with errors that name
// the part of the pointer that failed.
#pragma once

#include <nlohmann/json.hpp>
#include <stdexcept>
#include <string>

namespace VelkTools {

// A pointer that is malformed or does not fit the document. The text names
// the pointer (or the prefix of it that failed) and the problem.
class PointerError : public std::runtime_error {
public:
    explicit PointerError(const std::string& what) : std::runtime_error(what) {}
};

// The value at `pointer`; "" is the whole document.
const nlohmann::json& GetAt(const nlohmann::json& document, const std::string& pointer);

// Puts `value` at `pointer`. Missing object members on the way are created as
// objects; an array element is replaced, or appended when the index is the
// array's size or "-". The whole document ("") can only be replaced by an
// object.
void SetAt(nlohmann::json& document, const std::string& pointer, nlohmann::json value);

// Deletes the member or array element at `pointer`, which must exist.
void RemoveAt(nlohmann::json& document, const std::string& pointer);

// `text` parsed as JSON, or `text` itself as a JSON string when it is not JSON
// ("10.0.0.7" and "Hello" are strings, "42", "true" and "\"x\"" are JSON).
// JSON nested deeper than a state may be throws HostCtlException.
nlohmann::json ParseValue(const std::string& text);

}  // namespace VelkTools
