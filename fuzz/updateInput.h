// One end-to-end update decoded from a fuzzer's bytes: the loader, the
// identity block, the four registry values the loader reads, the image with
// its header text, and at most one fault. Short input reads as zeros, so every
// byte string is an input.
//
// Layout (multi-byte numbers little-endian):
//   0      flags: 1 loader 0x4A20 (else 0x4A10), 2 plugged in after the start,
//          4 image bytes 6 and 7 FF (room for the marker), 8 header text as UTF-16
//   1      fault kind (FaultKind, modulo its count)
//   2..3   fault argument (a request, allocation or read number, an address)
//   4      fault mask (the bits a corrupted read flips)
//   5..6   image length (0: the pattern's own length)
//   7..22  the identity block as it lies in flash
//   23..38 the flash at 0x0C00, where the loader's code has a signature the
//          identity repair looks for
//   then FVTPID, Driver, Firmware and SystemRoot, each: a form byte
//          (ValueForm, modulo its count), a length byte n, n bytes; text forms
//          take each byte as one UTF-16 character
//   then the header text: a length byte n (at most 60), n bytes, put at 514
//   the rest: the image pattern, repeated to the image length
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace fuzzing {

enum class ValueForm : uint8_t { absent, text, textWithoutNul, expandText, binary, count };

struct RegistryValueInput {
    ValueForm form = ValueForm::absent;
    std::vector<uint8_t> bytes;  // as given; see valueType and valueData

    uint32_t valueType() const;
    std::vector<uint8_t> valueData() const;  // what the registry stores
    std::string text() const;                // the bytes as characters
};

enum class FaultKind : uint8_t {
    none,
    stallRequest,       // the argument-th request stalls
    stallKind,          // every request of one kind (argument modulo 4) stalls
    corruptRead,        // reads of the cell at the argument come back xor the mask
    unplugAtRequest,    // the device is pulled out at the argument-th request
    failAllocation,     // the argument-th host allocation fails
    failRegistryQuery,  // the query of one value (argument modulo 4) fails
    failFileRead,       // the argument-th file read fails
    failSizeQuery,
    failSetPosition,
    failDeviceTree,  // one of the tree's calls (argument modulo 5) fails
    refuseStream,    // the device refuses its stream (argument even) or transfer buffer
    count
};

struct UpdateInput {
    uint16_t loaderProductId = 0x4A10;
    bool pluggedInLater = false;
    std::array<uint8_t, 16> identityBlock{};
    std::array<uint8_t, 16> signatureArea{};
    RegistryValueInput fvtpid, driver, firmware, systemRoot;
    FaultKind fault = FaultKind::none;
    uint16_t faultArgument = 0;
    uint8_t faultMask = 0;
    std::vector<uint8_t> image;
};

UpdateInput decodeUpdateInput(const uint8_t* data, size_t size);

}  // namespace fuzzing
