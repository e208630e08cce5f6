#include "updateInput.h"

#include <algorithm>

namespace fuzzing {

namespace {

constexpr size_t kHeaderOffset = 514;
constexpr size_t kHeaderBytes = 60;

class Reader {
  public:
    Reader(const uint8_t* data, size_t size) : data_(data), size_(size) {}

    uint8_t byte() { return position_ < size_ ? data_[position_++] : 0; }
    uint16_t word()
    {
        uint16_t low = byte();
        return static_cast<uint16_t>(low | byte() << 8);
    }
    std::vector<uint8_t> bytes(size_t count)
    {
        std::vector<uint8_t> result;
        for (size_t i = 0; i < count && position_ < size_; ++i) result.push_back(data_[position_++]);
        return result;
    }
    std::vector<uint8_t> rest() { return bytes(size_ - std::min(position_, size_)); }

  private:
    const uint8_t* data_;
    size_t size_;
    size_t position_ = 0;
};

RegistryValueInput readValue(Reader& reader)
{
    RegistryValueInput value;
    value.form = static_cast<ValueForm>(reader.byte() % static_cast<uint8_t>(ValueForm::count));
    value.bytes = reader.bytes(reader.byte());
    return value;
}

}  // namespace

uint32_t RegistryValueInput::valueType() const
{
    switch (form) {
    case ValueForm::expandText:
        return 2;  // REG_EXPAND_SZ
    case ValueForm::binary:
        return 3;  // REG_BINARY
    default:
        return 1;  // REG_SZ
    }
}

std::vector<uint8_t> RegistryValueInput::valueData() const
{
    if (form == ValueForm::binary) return bytes;
    std::vector<uint8_t> data;
    for (uint8_t character : bytes) {
        data.push_back(character);
        data.push_back(0);
    }
    if (form != ValueForm::textWithoutNul) data.insert(data.end(), {0, 0});
    return data;
}

std::string RegistryValueInput::text() const
{
    return std::string(bytes.begin(), bytes.end());
}

UpdateInput decodeUpdateInput(const uint8_t* data, size_t size)
{
    Reader reader(data, size);
    UpdateInput input;
    const uint8_t flags = reader.byte();
    input.loaderProductId = (flags & 1) ? 0x4A20 : 0x4A10;
    input.pluggedInLater = (flags & 2) != 0;
    input.fault = static_cast<FaultKind>(reader.byte() % static_cast<uint8_t>(FaultKind::count));
    input.faultArgument = reader.word();
    input.faultMask = reader.byte();
    const uint16_t imageLength = reader.word();
    for (uint8_t& byte : input.identityBlock) byte = reader.byte();
    for (uint8_t& byte : input.signatureArea) byte = reader.byte();
    input.fvtpid = readValue(reader);
    input.driver = readValue(reader);
    input.firmware = readValue(reader);
    input.systemRoot = readValue(reader);
    std::vector<uint8_t> header = reader.bytes(std::min<size_t>(reader.byte(), kHeaderBytes));
    const std::vector<uint8_t> pattern = reader.rest();

    const size_t length = imageLength != 0 ? imageLength : pattern.size();
    input.image.resize(length);
    for (size_t i = 0; i < length; ++i) {
        input.image[i] = pattern.empty() ? static_cast<uint8_t>(i * 7 + (i >> 9)) : pattern[i % pattern.size()];
    }
    if (flags & 4) {
        for (size_t i = 6; i < 8 && i < length; ++i) input.image[i] = 0xFF;
    }
    if (flags & 8) {
        std::vector<uint8_t> wide;
        for (uint8_t character : header) wide.insert(wide.end(), {character, 0});
        header = wide;
        header.resize(std::min(header.size(), kHeaderBytes));
    }
    for (size_t i = 0; i < header.size() && kHeaderOffset + i < length; ++i) input.image[kHeaderOffset + i] = header[i];
    return input;
}

}  // namespace fuzzing
