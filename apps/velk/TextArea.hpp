// A window that shows one text written in the console's mark-up: colours,
// alignment, fixed-width columns, word wrap and host values.
#pragma once

#include <functional>
#include <map>
#include <string>

#include "Window.hpp"

namespace Velk {

class TextArea : public Window {
public:
    using Getter = std::string (*)();

    // The area takes the parent's background; color is the text's default
    // foreground, -1 takes the parent's foreground too.
    TextArea(Window* parent, int x, int y, int width, int height, int color, const std::string& text = "");
    ~TextArea() override;

    // Replace or extend the text; both lay the whole text out again and redraw.
    void SetText(const std::string& text);
    void AppendText(const std::string& text);
    const std::string& GetText() const { return _text; }
    // Hidden areas redraw their text dimmed, visible ones in its colours.
    void Show(bool visible) override;

    // Lays out mark-up to a width in screen columns (DisplayWidth.hpp: wide
    // characters take two, combining ones none, invalid UTF-8 comes out as
    // U+FFFD): returns the text with line breaks inserted,
    // alignment blanks added, value keys expanded and colour tags kept.
    // lookup answers a value key with its text, or false when the key is
    // unknown. Pure: no curses, no host. A literal "{" (from a value, or
    // written "{lbrace}" in the mark-up) comes out as "{lbrace}", so that the
    // result never holds a brace that could be taken for a tag.
    static std::string Layout(const std::string& text, int width,
                              const std::function<bool(const std::string&, std::string&)>& lookup);

    // Mark-up that shows `plain` as it stands (user input: "{" is escaped).
    static std::string Escape(const std::string& plain);

    // Screen columns of UTF-8 text without mark-up: two for a wide
    // character, none for a combining one, one for an invalid byte.
    static int Columns(const std::string& plain);

    // Host values reachable through value keys ("{ip}", "{hostname}", ...).
    static std::string GetIpValue();
    static std::string GetHostnameValue();
    static std::string GetTarnProduct();
    static std::string GetTarnVersion();
    static std::string GetSystemMemory();
    static std::string GetSSLThumbprintValue();
    static std::string GetSSHRsaKeyFingerprintValue();
    static std::string GetSSHDsaKeyFingerprintValue();
    static std::string GetBIOSVersion();
    static std::string GetBMCVersion();
    static std::string GetCPLDVersion();
    static std::string GetPLSAVersion();
    static std::string GetAssetTag();

private:
    void Draw();

    std::string _text;
    std::map<std::string, int> _colors;
    std::map<std::string, Getter> _values;
};

}  // namespace Velk
