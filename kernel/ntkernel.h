// The Windows kernel services the module calls, declared as the module sees
// them. On Windows these resolve against ntoskrnl.exe; on Linux against the
// kernel stand-in, which exports the same names.
#pragma once

#include <stddef.h>
#include <stdint.h>

#if defined(_WIN32)
typedef long NTSTATUS;
typedef wchar_t WCHAR;
#define KTEXT(text) L##text
#else
typedef int32_t NTSTATUS;
typedef char16_t WCHAR;
#define KTEXT(text) u##text
#endif

typedef void* HANDLE;

constexpr NTSTATUS kStatusSuccess = 0;
constexpr NTSTATUS kStatusObjectNameNotFound = static_cast<NTSTATUS>(0xC0000034u);
constexpr NTSTATUS kStatusEndOfFile = static_cast<NTSTATUS>(0xC0000011u);
constexpr NTSTATUS kStatusDriverUnableToLoad = static_cast<NTSTATUS>(0xC000026Cu);

struct UNICODE_STRING {
    uint16_t Length;         // bytes, without the NUL
    uint16_t MaximumLength;  // bytes
    WCHAR* Buffer;
};
static_assert(sizeof(UNICODE_STRING) == 16, "counted string is 16 bytes");
static_assert(offsetof(UNICODE_STRING, Length) == 0, "Length at 0");
static_assert(offsetof(UNICODE_STRING, MaximumLength) == 2, "MaximumLength at 2");
static_assert(offsetof(UNICODE_STRING, Buffer) == 8, "Buffer at 8");

struct OBJECT_ATTRIBUTES {
    uint32_t Length;
    HANDLE RootDirectory;
    UNICODE_STRING* ObjectName;
    uint32_t Attributes;
    void* SecurityDescriptor;
    void* SecurityQualityOfService;
};
static_assert(sizeof(OBJECT_ATTRIBUTES) == 48, "object attributes are 48 bytes");
static_assert(offsetof(OBJECT_ATTRIBUTES, RootDirectory) == 8, "RootDirectory at 8");
static_assert(offsetof(OBJECT_ATTRIBUTES, ObjectName) == 16, "ObjectName at 16");
static_assert(offsetof(OBJECT_ATTRIBUTES, Attributes) == 24, "Attributes at 24");
static_assert(offsetof(OBJECT_ATTRIBUTES, SecurityDescriptor) == 32, "SecurityDescriptor at 32");
static_assert(offsetof(OBJECT_ATTRIBUTES, SecurityQualityOfService) == 40, "QoS at 40");

constexpr uint32_t kObjCaseInsensitive = 0x40;
// Arrivals run on whatever thread the host calls back on. A handle opened
// there without this flag would land in that process's handle table, where
// user mode could close or swap it between the open and the reads.
constexpr uint32_t kObjKernelHandle = 0x200;

struct IO_STATUS_BLOCK {
    union {
        NTSTATUS Status;
        void* Pointer;
    };
    uintptr_t Information;
};
static_assert(sizeof(IO_STATUS_BLOCK) == 16, "I/O status block is 16 bytes");
static_assert(offsetof(IO_STATUS_BLOCK, Information) == 8, "Information at 8");

union LARGE_INTEGER {
    struct {
        uint32_t LowPart;
        int32_t HighPart;
    } u;
    int64_t QuadPart;
};
static_assert(sizeof(LARGE_INTEGER) == 8, "LARGE_INTEGER is 8 bytes");

// Registry
constexpr uint32_t kKeyRead = 0x20019;
constexpr uint32_t kRegSz = 1;
constexpr uint32_t kRegExpandSz = 2;
constexpr uint32_t kRegBinary = 3;
constexpr uint32_t kRegDword = 4;
constexpr uint32_t kRegMultiSz = 7;
constexpr int kKeyValuePartialInformation = 2;

struct KEY_VALUE_PARTIAL_INFORMATION {
    uint32_t TitleIndex;
    uint32_t Type;
    uint32_t DataLength;
    uint8_t Data[1];
};
static_assert(offsetof(KEY_VALUE_PARTIAL_INFORMATION, Type) == 4, "Type at 4");
static_assert(offsetof(KEY_VALUE_PARTIAL_INFORMATION, DataLength) == 8, "DataLength at 8");
static_assert(offsetof(KEY_VALUE_PARTIAL_INFORMATION, Data) == 12, "Data at 12");

// Files
constexpr uint32_t kFileReadAccess = 0x20001;  // READ_CONTROL | FILE_READ_DATA
constexpr uint32_t kFileAttributeNormal = 0x80;
constexpr uint32_t kFileShareRead = 0x1;
constexpr uint32_t kFileOpen = 1;
constexpr uint32_t kFileNonDirectoryFile = 0x40;
constexpr uint32_t kFileSynchronousIoNonalert = 0x20;
constexpr uint32_t kFileSequentialOnly = 0x04;
constexpr int kFileStandardInformation = 5;
constexpr int kFilePositionInformation = 14;

struct FILE_STANDARD_INFORMATION {
    LARGE_INTEGER AllocationSize;
    LARGE_INTEGER EndOfFile;
    uint32_t NumberOfLinks;
    uint8_t DeletePending;
    uint8_t Directory;
};
static_assert(sizeof(FILE_STANDARD_INFORMATION) == 24, "standard information is 24 bytes");
static_assert(offsetof(FILE_STANDARD_INFORMATION, EndOfFile) == 8, "EndOfFile at 8");
static_assert(offsetof(FILE_STANDARD_INFORMATION, NumberOfLinks) == 16, "NumberOfLinks at 16");

struct FILE_POSITION_INFORMATION {
    LARGE_INTEGER CurrentByteOffset;
};
static_assert(sizeof(FILE_POSITION_INFORMATION) == 8, "position information is 8 bytes");

extern "C" {
NTSTATUS ZwCreateKey(HANDLE* keyHandle, uint32_t desiredAccess, OBJECT_ATTRIBUTES* objectAttributes,
                     uint32_t titleIndex, UNICODE_STRING* keyClass, uint32_t createOptions,
                     uint32_t* disposition);
NTSTATUS ZwQueryValueKey(HANDLE keyHandle, UNICODE_STRING* valueName, int informationClass,
                         void* information, uint32_t length, uint32_t* resultLength);
NTSTATUS ZwClose(HANDLE handle);
NTSTATUS ZwCreateFile(HANDLE* fileHandle, uint32_t desiredAccess, OBJECT_ATTRIBUTES* objectAttributes,
                      IO_STATUS_BLOCK* ioStatus, LARGE_INTEGER* allocationSize, uint32_t fileAttributes,
                      uint32_t shareAccess, uint32_t createDisposition, uint32_t createOptions,
                      void* eaBuffer, uint32_t eaLength);
NTSTATUS ZwReadFile(HANDLE fileHandle, HANDLE event, void* apcRoutine, void* apcContext,
                    IO_STATUS_BLOCK* ioStatus, void* buffer, uint32_t length, LARGE_INTEGER* byteOffset,
                    uint32_t* key);
NTSTATUS ZwQueryInformationFile(HANDLE fileHandle, IO_STATUS_BLOCK* ioStatus, void* information,
                                uint32_t length, int informationClass);
NTSTATUS ZwSetInformationFile(HANDLE fileHandle, IO_STATUS_BLOCK* ioStatus, void* information,
                              uint32_t length, int informationClass);
void RtlInitUnicodeString(UNICODE_STRING* destination, const WCHAR* source);
void RtlCopyUnicodeString(UNICODE_STRING* destination, const UNICODE_STRING* source);
#if defined(_WIN32)
WCHAR* wcschr(const WCHAR* text, WCHAR character);
#endif
}

#if !defined(_WIN32)
// The kernel's wcschr works on UTF-16, glibc's on 32-bit wchar_t, and both are
// the C symbol "wcschr". Declared with C linkage, ours would be a second C
// function of that name beside glibc's, which clang refuses wherever <cwchar>
// is also seen. As a C++ overload on char16_t bound to the same symbol it
// stays the import "wcschr" that the kernel stand-in's version script exports.
WCHAR* wcschr(const WCHAR* text, WCHAR character) __asm__("wcschr");
#endif
