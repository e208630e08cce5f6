#include "svgCanvas.h"

#include <iterator>

#include <fmt/format.h>

namespace lab {

namespace {

// The length of the UTF-8 sequence that starts text[at], or 0 when it is not one.
size_t utf8Length(const std::string& text, size_t at)
{
    auto byte = [&](size_t i) { return static_cast<unsigned char>(text[i]); };
    unsigned char lead = byte(at);
    size_t length = lead < 0x80 ? 1 : (lead >> 5) == 0x6 ? 2 : (lead >> 4) == 0xE ? 3 : (lead >> 3) == 0x1E ? 4 : 0;
    if (length == 0 || at + length > text.size()) return 0;
    for (size_t i = 1; i < length; ++i) {
        if ((byte(at + i) & 0xC0) != 0x80) return 0;
    }
    if (length == 2 && lead < 0xC2) return 0;  // overlong
    return length;
}

}  // namespace

std::string xmlEscaped(const std::string& text)
{
    std::string out;
    out.reserve(text.size());
    for (size_t i = 0; i < text.size();) {
        size_t length = utf8Length(text, i);
        if (length == 0) {
            out += '?';
            ++i;
            continue;
        }
        char c = text[i];
        if (length > 1) {
            out.append(text, i, length);
        } else if (c == '&') {
            out += "&amp;";
        } else if (c == '<') {
            out += "&lt;";
        } else if (c == '>') {
            out += "&gt;";
        } else if (c == '"') {
            out += "&quot;";
        } else if (c == '\'') {
            out += "&apos;";
        } else if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) {
            out += '?';
        } else {
            out += c;
        }
        i += length;
    }
    return out;
}

void SvgCanvas::rect(double x, double y, double w, double h, const char* fill, const std::string& tooltip,
                     const char* stroke, double strokeWidth)
{
    auto out = std::back_inserter(body_);
    fmt::format_to(out, R"(<rect x="{:.1f}" y="{:.1f}" width="{:.2f}" height="{:.1f}" fill="{}")", x, y, w, h, fill);
    if (stroke != nullptr) fmt::format_to(out, R"( stroke="{}" stroke-width="{:.1f}")", stroke, strokeWidth);
    if (tooltip.empty()) {
        body_ += "/>\n";
    } else {
        fmt::format_to(out, "><title>{}</title></rect>\n", xmlEscaped(tooltip));
    }
}

void SvgCanvas::line(double x1, double y1, double x2, double y2, const char* stroke, double strokeWidth, bool dashed)
{
    fmt::format_to(std::back_inserter(body_),
                   R"(<line x1="{:.1f}" y1="{:.1f}" x2="{:.1f}" y2="{:.1f}" stroke="{}" stroke-width="{:.1f}"{}/>)"
                   "\n",
                   x1, y1, x2, y2, stroke, strokeWidth, dashed ? R"( stroke-dasharray="4 3")" : "");
}

void SvgCanvas::text(double x, double y, const std::string& text, const TextStyle& style)
{
    fmt::format_to(std::back_inserter(body_),
                   R"(<text x="{:.1f}" y="{:.1f}" font-size="{:.1f}" text-anchor="{}" fill="{}"{}>{}</text>)"
                   "\n",
                   x, y, style.size, style.anchor, style.fill, style.bold ? R"( font-weight="bold")" : "",
                   xmlEscaped(text));
}

std::string SvgCanvas::document(double height, const std::string& title) const
{
    std::string out = fmt::format(
        "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
        R"(<svg xmlns="http://www.w3.org/2000/svg" width="{0:.0f}" height="{1:.0f}" viewBox="0 0 {0:.0f} {1:.0f}" )"
        R"(font-family="DejaVu Sans, Verdana, Arial, sans-serif">)"
        "\n<title>{2}</title>\n"
        R"(<rect x="0" y="0" width="{0:.0f}" height="{1:.0f}" fill="#ffffff"/>)"
        "\n",
        width_, height, xmlEscaped(title));
    out += body_;
    out += "</svg>\n";
    return out;
}

}  // namespace lab
