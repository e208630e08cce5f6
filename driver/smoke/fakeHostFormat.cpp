#include "fakeHost.h"

namespace {

class Writer {
public:
    Writer(char* out, size_t capacity) : out_(out), capacity_(capacity) {}
    void put(char c)
    {
        if (length_ + 1 < capacity_) out_[length_++] = c;
    }
    void finish() { out_[length_ < capacity_ ? length_ : capacity_ - 1] = 0; }

private:
    char* out_;
    size_t capacity_;
    size_t length_ = 0;
};

void putNumber(Writer& writer, uint32_t value, bool negative, uint32_t base, bool upper, uint32_t width, bool zeroPad)
{
    const char* digits = upper ? "0123456789ABCDEF" : "0123456789abcdef";
    char reversed[12];
    uint32_t count = 0;
    do {
        reversed[count++] = digits[value % base];
        value /= base;
    } while (value != 0);
    uint32_t used = count + (negative ? 1 : 0);
    if (negative && zeroPad) writer.put('-');
    for (; used < width; ++used) writer.put(zeroPad ? '0' : ' ');
    if (negative && !zeroPad) writer.put('-');
    while (count != 0) writer.put(reversed[--count]);
}

}  // namespace

void formatText(char* out, size_t capacity, const char* format, va_list arguments)
{
    if (capacity == 0) return;
    Writer writer(out, capacity);
    for (const char* p = format; *p != 0; ++p) {
        if (*p != '%') {
            writer.put(*p);
            continue;
        }
        const char* start = p++;
        bool zeroPad = false;
        if (*p == '0') {
            zeroPad = true;
            ++p;
        }
        uint32_t width = 0;
        for (; *p >= '0' && *p <= '9'; ++p) width = width * 10 + static_cast<uint32_t>(*p - '0');
        switch (*p) {
        case 'd':
        case 'i': {
            const int32_t value = va_arg(arguments, int32_t);
            const uint32_t magnitude = value < 0 ? 0u - static_cast<uint32_t>(value) : static_cast<uint32_t>(value);
            putNumber(writer, magnitude, value < 0, 10, false, width, zeroPad);
            break;
        }
        case 'u':
            putNumber(writer, va_arg(arguments, uint32_t), false, 10, false, width, zeroPad);
            break;
        case 'x':
        case 'X':
            putNumber(writer, va_arg(arguments, uint32_t), false, 16, *p == 'X', width, zeroPad);
            break;
        case 'c':
            writer.put(static_cast<char>(va_arg(arguments, int)));
            break;
        case 's': {
            const char* text = va_arg(arguments, const char*);
            for (const char* c = text != nullptr ? text : "(null)"; *c != 0; ++c) writer.put(*c);
            break;
        }
        case '%':
            writer.put('%');
            break;
        default:
            for (const char* c = start; c <= p && *c != 0; ++c) writer.put(*c);
            if (*p == 0) --p;
        }
    }
    writer.finish();
}

void formatInto(char* out, size_t capacity, const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    formatText(out, capacity, format, arguments);
    va_end(arguments);
}
