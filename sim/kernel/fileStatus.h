// Kernel statuses the file stand-in answers with, beyond the few the module
// itself names.
#pragma once

#include "../../kernel/ntkernel.h"

namespace sim::kernel::fileStatus {

constexpr NTSTATUS invalidInfoClass = static_cast<NTSTATUS>(0xC0000003u);
constexpr NTSTATUS infoLengthMismatch = static_cast<NTSTATUS>(0xC0000004u);
constexpr NTSTATUS invalidHandle = static_cast<NTSTATUS>(0xC0000008u);
constexpr NTSTATUS invalidParameter = static_cast<NTSTATUS>(0xC000000Du);
constexpr NTSTATUS endOfFile = static_cast<NTSTATUS>(0xC0000011u);
constexpr NTSTATUS accessDenied = static_cast<NTSTATUS>(0xC0000022u);
constexpr NTSTATUS objectNameInvalid = static_cast<NTSTATUS>(0xC0000033u);
constexpr NTSTATUS objectNameNotFound = static_cast<NTSTATUS>(0xC0000034u);
constexpr NTSTATUS objectPathNotFound = static_cast<NTSTATUS>(0xC000003Au);
constexpr NTSTATUS sharingViolation = static_cast<NTSTATUS>(0xC0000043u);
constexpr NTSTATUS fileIsADirectory = static_cast<NTSTATUS>(0xC00000BAu);
constexpr NTSTATUS deviceDataError = static_cast<NTSTATUS>(0xC000009Cu); // a handy "the disk failed"

// IO_STATUS_BLOCK.Information of a successful open of an existing file.
constexpr uintptr_t fileOpened = 1;

} // namespace sim::kernel::fileStatus
