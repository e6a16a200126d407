#include "StateEdit.hpp"

#include <vector>

#include "hostctl/SimState.hpp"

namespace VelkTools {

using nlohmann::json;

namespace {

using Tokens = std::vector<std::string>;

Tokens Split(const std::string& pointer) {
    Tokens tokens;
    if (pointer.empty()) return tokens;
    if (pointer[0] != '/')
        throw PointerError("bad pointer \"" + pointer +
                           "\": it must start with \"/\" (or be empty for the whole document)");
    std::string token;
    for (size_t i = 1; i < pointer.size(); ++i) {
        char c = pointer[i];
        if (c == '/') {
            tokens.push_back(token);
            token.clear();
        } else if (c == '~') {
            char next = i + 1 < pointer.size() ? pointer[i + 1] : '\0';
            if (next != '0' && next != '1')
                throw PointerError("bad pointer \"" + pointer + "\": \"~\" must be followed by 0 or 1");
            token += next == '0' ? '~' : '/';
            ++i;
        } else {
            token += c;
        }
    }
    tokens.push_back(token);
    return tokens;
}

// The pointer made of the first `count` tokens, escaped again, for messages.
std::string Prefix(const Tokens& tokens, size_t count) {
    std::string out;
    for (size_t i = 0; i < count; ++i) {
        out += '/';
        for (char c : tokens[i]) {
            if (c == '~')
                out += "~0";
            else if (c == '/')
                out += "~1";
            else
                out += c;
        }
    }
    return out;
}

// An array index as the pointer syntax allows it: decimal digits, no leading
// zero. Very long numbers are out of range anyway and are refused here.
bool ParseIndex(const std::string& token, size_t& index) {
    if (token.empty() || token.size() > 18) return false;
    if (token.size() > 1 && token[0] == '0') return false;
    index = 0;
    for (char c : token) {
        if (c < '0' || c > '9') return false;
        index = index * 10 + size_t(c - '0');
    }
    return true;
}

PointerError NotAContainer(const Tokens& tokens, size_t depth, const json& value) {
    std::string name = depth == 0 ? std::string("the document") : Prefix(tokens, depth);
    return PointerError(Prefix(tokens, depth + 1) + ": " + name + " is " +
                        (value.is_null() ? std::string("null") : "a " + std::string(value.type_name())) +
                        ", not an object or array");
}

size_t ExistingIndex(const Tokens& tokens, size_t depth, const json& array) {
    size_t index = 0;
    if (!ParseIndex(tokens[depth], index))
        throw PointerError(Prefix(tokens, depth + 1) + ": \"" + tokens[depth] + "\" is not an array index");
    if (index >= array.size())
        throw PointerError(Prefix(tokens, depth + 1) + ": no such element (the array has " +
                           std::to_string(array.size()) + ")");
    return index;
}

// The child named by tokens[depth] of `parent`, which must exist.
template <typename Json>
Json& Child(Json& parent, const Tokens& tokens, size_t depth) {
    const std::string& token = tokens[depth];
    if (parent.is_object()) {
        auto it = parent.find(token);
        if (it == parent.end()) throw PointerError(Prefix(tokens, depth + 1) + ": no such field");
        return *it;
    }
    if (parent.is_array()) return parent[ExistingIndex(tokens, depth, parent)];
    throw NotAContainer(tokens, depth, parent);
}

}  // namespace

const json& GetAt(const json& document, const std::string& pointer) {
    Tokens tokens = Split(pointer);
    const json* at = &document;
    for (size_t i = 0; i < tokens.size(); ++i) at = &Child(*at, tokens, i);
    return *at;
}

void SetAt(json& document, const std::string& pointer, json value) {
    Tokens tokens = Split(pointer);
    if (tokens.empty()) {
        if (!value.is_object())
            throw PointerError("the whole document can only be replaced by a JSON object");
        document = std::move(value);
        return;
    }
    json* at = &document;
    for (size_t i = 0; i + 1 < tokens.size(); ++i) {
        if (at->is_object() && !at->contains(tokens[i])) (*at)[tokens[i]] = json::object();
        at = &Child(*at, tokens, i);
    }
    size_t last = tokens.size() - 1;
    const std::string& token = tokens[last];
    if (at->is_object()) {
        (*at)[token] = std::move(value);
    } else if (at->is_array()) {
        size_t index = 0;
        if (token == "-" || (ParseIndex(token, index) && index == at->size()))
            at->push_back(std::move(value));
        else
            (*at)[ExistingIndex(tokens, last, *at)] = std::move(value);
    } else {
        throw NotAContainer(tokens, last, *at);
    }
}

void RemoveAt(json& document, const std::string& pointer) {
    Tokens tokens = Split(pointer);
    if (tokens.empty()) throw PointerError("the whole document cannot be removed");
    json* at = &document;
    for (size_t i = 0; i + 1 < tokens.size(); ++i) at = &Child(*at, tokens, i);
    size_t last = tokens.size() - 1;
    if (at->is_object()) {
        if (at->erase(tokens[last]) == 0) throw PointerError(Prefix(tokens, last + 1) + ": no such field");
    } else if (at->is_array()) {
        at->erase(at->begin() + std::ptrdiff_t(ExistingIndex(tokens, last, *at)));
    } else {
        throw NotAContainer(tokens, last, *at);
    }
}

json ParseValue(const std::string& text) {
    // Refused before parsing: copying or writing such a value would overflow
    // the stack, and no state could hold it anyway.
    if (HostCtl::Lib::JsonTextDepth(text, HostCtl::Lib::kMaxStateDepth) > HostCtl::Lib::kMaxStateDepth)
        throw HostCtl::Lib::HostCtlException("the value nests arrays and objects deeper than " +
                                             std::to_string(HostCtl::Lib::kMaxStateDepth) + " levels");
    try {
        return json::parse(text);
    } catch (const json::exception&) {
        // Not JSON, or a number no double holds ("1e400"): the text itself.
        return json(text);
    }
}

}  // namespace VelkTools
