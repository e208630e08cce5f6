// The repair of an erased product ID word on the small loader: from the copy
// word and the serial list, the alternative word, or the firmware in flash.
#include "identityCheckWorld.h"
#include "source/statusCodes.h"

using namespace identity_test;

namespace {

std::vector<std::string> fromCopy(const std::string& written)
{
    return on4A10({"read 37F2 2", "write 37F0 " + written, "write 37F2 " + written});
}

std::vector<std::string> fromFirmware(const std::string& written)
{
    return on4A10({"read 37F2 2", "read 37FA 2", "read 0C00 16", "write 37F0 " + written, "write 37F2 " + written});
}

const std::vector<std::string> kNotRecognised = on4A10({"read 37F2 2", "read 37FA 2", "read 0C00 16"});

std::vector<uint8_t> changed(const uint8_t (&signature)[16], size_t at)
{
    std::vector<uint8_t> result = bytes(signature);
    result[at] ^= 0x01;
    return result;
}

// Vendor 0x5C1D with an erased product ID word, on the small loader.
sim::IdentityValues erased(uint32_t serialNumber, uint16_t productIdCopy, uint16_t altProductId = 0xFFFF)
{
    return block(0x5C1D, 0xFFFF, serialNumber, productIdCopy, altProductId);
}

const IdentityCase kCases[] = {
    {"CopyFixedForTheFirstListedSerial", 0x4A10, erased(0x00E08820, 0x4B02), {}, 0, 0, 0x4B01, fromCopy("4B01")},
    {"CopyFixedForTheLastListedSerial", 0x4A10, erased(0x00E0DECC, 0x4B02), {}, 0, 0, 0x4B01, fromCopy("4B01")},
    {"CopyKeptForASerialJustAfterARun", 0x4A10, erased(0x00E08834, 0x4B02), {}, 0, 0, 0x4B02, fromCopy("4B02")},
    {"CopyKeptForSerialZero", 0x4A10, erased(0x00000000, 0x4B02), {}, 0, 0, 0x4B02, fromCopy("4B02")},
    {"ZeroCopyIsWrittenAndReturned", 0x4A10, erased(0x00E08820, 0x0000), {}, 0, 0, 0x0000, fromCopy("0000")},
    // Signature B at 0x0C00 would say 0x4B02: the flash is not looked at.
    {"AlternativeProductTakenWithoutTheFirmware", 0x4A10, erased(0x0001E240, 0xFFFF, 0x4B03), bytes(kSignatureB), 0,
     0, 0x4B03, on4A10({"read 37F2 2", "read 37FA 2", "write 37F0 4B03", "write 37F2 4B03"})},

    {"SignatureAOutsideTheRanges", 0x4A10, erased(0x0001E240, 0xFFFF), bytes(kSignatureA), 0, 0, 0x4B01,
     fromFirmware("4B01")},
    {"SignatureAAtTheLowBoundOfRow4", 0x4A10, erased(0x00E10F22, 0xFFFF), bytes(kSignatureA), 0, 0, 0x4B02,
     fromFirmware("4B02")},
    {"SignatureAJustBelowRow4", 0x4A10, erased(0x00E10F21, 0xFFFF), bytes(kSignatureA), 0, 0, 0x4B01,
     fromFirmware("4B01")},
    {"SignatureAInTheSingleSerialRow6", 0x4A10, erased(0x00E008CB, 0xFFFF), bytes(kSignatureA), 0, 0, 0x4B02,
     fromFirmware("4B02")},
    {"SignatureAWithAnAlternativeOtherThan4B03", 0x4A10, erased(0x00E10F21, 0xFFFF, 0x4B02), bytes(kSignatureA), 0, 0,
     0x4B01, fromFirmware("4B01")},
    {"SignatureBOutsideTheRanges", 0x4A10, erased(0x0001E240, 0xFFFF), bytes(kSignatureB), 0, 0, 0x4B02,
     fromFirmware("4B02")},
    {"SignatureBWhateverTheSerial", 0x4A10, erased(0x00E10F21, 0xFFFF), bytes(kSignatureB), 0, 0, 0x4B02,
     fromFirmware("4B02")},

    {"ErasedFirmwareIsNotRecognised", 0x4A10, erased(0x00E10F22, 0xFFFF), {}, 0, kStatusFlashNotRecognised, 0,
     kNotRecognised},
    {"SignatureAWithItsLastByteChanged", 0x4A10, erased(0x00E10F22, 0xFFFF), changed(kSignatureA, 15), 0,
     kStatusFlashNotRecognised, 0, kNotRecognised},
    {"SignatureBWithItsFirstByteChanged", 0x4A10, erased(0x0001E240, 0xFFFF), changed(kSignatureB, 0), 0,
     kStatusFlashNotRecognised, 0, kNotRecognised},
};

}  // namespace

INSTANTIATE_TEST_SUITE_P(ProductIdRepair, IdentityCheckTable, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });
