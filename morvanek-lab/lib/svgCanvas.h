// A small writer of plain SVG: rectangles, lines and text, with every text
// escaped so that any name from a scenario still gives a well-formed file.
#pragma once

#include <string>

namespace lab {

// Text fit for XML character data and attribute values: markup characters
// escaped, control characters and broken UTF-8 replaced by '?'.
std::string xmlEscaped(const std::string& text);

struct TextStyle {
    double size = 12;
    const char* anchor = "start";  // "start", "middle", "end"
    const char* fill = "#222222";
    bool bold = false;
};

class SvgCanvas {
public:
    explicit SvgCanvas(double width) : width_(width) {}

    double width() const { return width_; }
    // A rectangle; a tooltip becomes its <title>, which browsers show on hover.
    void rect(double x, double y, double w, double h, const char* fill, const std::string& tooltip = "",
              const char* stroke = nullptr, double strokeWidth = 1);
    void line(double x1, double y1, double x2, double y2, const char* stroke, double strokeWidth = 1,
              bool dashed = false);
    void text(double x, double y, const std::string& text, const TextStyle& style = {});

    // The whole document, as tall as what was drawn needs, with a title for
    // the picture as a whole.
    std::string document(double height, const std::string& title) const;

private:
    double width_;
    std::string body_;
};

}  // namespace lab
