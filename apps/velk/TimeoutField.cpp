#include "TimeoutField.hpp"

#include <charconv>

#include "InputItem.hpp"
#include "MessageDialog.hpp"

namespace Velk {

TimeoutEntry ReadTimeoutField(const std::string& text) {
    if (text.empty()) return {TimeoutEntry::Empty, 0};
    long value = -1;
    const char* end = text.data() + text.size();
    const auto [stop, error] = std::from_chars(text.data(), end, value);
    if (error != std::errc() || stop != end || value < 0 || value > MAX_TIMEOUT_MINUTES)
        return {TimeoutEntry::Invalid, 0};
    return {TimeoutEntry::Minutes, value};
}

bool IsTimeoutFieldKey(int key) { return (key >= '0' && key <= '9') || InputItem::IsEditingKey(key); }

void ShowInvalidTimeout(Frame* parent) { MessageDialog(parent, 269, 270).Execute(); }

}  // namespace Velk
