#include "wireArguments.h"

#include "wineProcess.h"

namespace lab {

long long WireArguments::nextSigned(hostformat::Argument kind)
{
    return static_cast<long long>(number(kind));
}

unsigned long long WireArguments::nextUnsigned(hostformat::Argument kind)
{
    return number(kind);
}

const void* WireArguments::nextPointer()
{
    return reinterpret_cast<const void*>(static_cast<uintptr_t>(number(hostformat::Argument::pointer)));
}

std::string WireArguments::nextText()
{
    if (!expect(hostformat::Argument::text)) return "(null)";
    bool isNull = false;
    std::string text = readText(in_, &isNull);
    return isNull ? "(null)" : text;
}

std::string WireArguments::nextText16()
{
    if (!expect(hostformat::Argument::text16)) return "(null)";
    bool isNull = false;
    std::u16string text = readText16(in_, &isNull);
    return isNull ? "(null)" : sim::utf16ToUtf8(text.data(), text.size());
}

bool WireArguments::expect(hostformat::Argument kind)
{
    if (broken_) return false;
    broken_ = in_.u32() != static_cast<uint32_t>(kind) || in_.broken();
    return !broken_;
}

uint64_t WireArguments::number(hostformat::Argument kind)
{
    return expect(kind) ? in_.u64() : 0;
}

}  // namespace lab
