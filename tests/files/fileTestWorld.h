// A fresh world with drive C: mapped to a temporary folder, and the kernel
// file calls made with the structures the module builds.
#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "sim/kernel/kernelUtf16.h"
#include "tests/support/worldTest.h"

namespace files_test {

namespace fs = std::filesystem;
namespace status = sim::kernel::fileStatus;
using sim::kernel::files;

// ZwCreateFile's arguments, as the module passes them unless a test changes one.
struct CreateRequest {
    std::u16string name = u"\\??\\C:\\image.bin";  // the whole object name
    int nameBytes = -1;                            // the counted length, when not -1
    uint32_t desiredAccess = kFileReadAccess;
    uint32_t shareAccess = kFileShareRead;
    uint32_t disposition = kFileOpen;
    uint32_t options = kFileNonDirectoryFile | kFileSynchronousIoNonalert | kFileSequentialOnly;
    uint32_t attributesLength = sizeof(OBJECT_ATTRIBUTES);
    uint32_t attributeFlags = kObjCaseInsensitive | kObjKernelHandle;
    HANDLE rootDirectory = nullptr;
    uint32_t eaLength = 0;
};

struct CreateResult {
    NTSTATUS status = 0;
    HANDLE handle = nullptr;
    IO_STATUS_BLOCK ioStatus{};
};

struct ReadResult {
    NTSTATUS status = 0;
    std::vector<uint8_t> bytes;  // as many as the call reported read
};

inline std::vector<uint8_t> patternBytes(size_t count, uint8_t seed = 0)
{
    std::vector<uint8_t> bytes(count);
    for (size_t i = 0; i < count; ++i) bytes[i] = static_cast<uint8_t>(i * 7 + seed + i / 251);
    return bytes;
}

inline void writeFile(const fs::path& file, const std::vector<uint8_t>& bytes)
{
    fs::create_directories(file.parent_path());
    std::ofstream(file, std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
}

class FileWorldTest : public testing_support::WorldTest {
  protected:
    void SetUp() override
    {
        WorldTest::SetUp();
        static int serial = 0;
        top_ =
            fs::path(::testing::TempDir()) / ("files-" + std::to_string(::getpid()) + "-" + std::to_string(++serial));
        fs::remove_all(top_);
        fs::create_directories(drive());
        files().mapDrive('C', drive());
    }
    void TearDown() override
    {
        WorldTest::TearDown();
        std::error_code ignored;
        fs::remove_all(top_, ignored);
    }

    // The folder that stands for C:, and the folder around it (outside the drive).
    fs::path drive() const { return top_ / "drive-c"; }
    const fs::path& outside() const { return top_; }

    static CreateResult create(const CreateRequest& request)
    {
        // A zero-filled name buffer with a counted string over it, as the module builds it.
        std::vector<WCHAR> name(request.name.begin(), request.name.end());
        name.resize(name.size() + 4, 0);
        UNICODE_STRING objectName;
        RtlInitUnicodeString(&objectName, name.data());
        if (request.nameBytes >= 0) objectName.Length = static_cast<uint16_t>(request.nameBytes);
        OBJECT_ATTRIBUTES attributes{
            request.attributesLength, request.rootDirectory, &objectName, request.attributeFlags, nullptr, nullptr};
        CreateResult result;
        result.status = ZwCreateFile(&result.handle, request.desiredAccess, &attributes, &result.ioStatus, nullptr,
                                     kFileAttributeNormal, request.shareAccess, request.disposition, request.options,
                                     nullptr, request.eaLength);
        return result;
    }

    // Opens a DOS path the way the module's image open does.
    static HANDLE openOrFail(const std::u16string& dosPath)
    {
        CreateResult result = create({u"\\??\\" + dosPath});
        EXPECT_EQ(result.status, 0) << sim::kernel::toUtf8(dosPath);
        return result.handle;
    }

    static ReadResult read(HANDLE file, uint32_t length, LARGE_INTEGER* byteOffset = nullptr)
    {
        std::vector<uint8_t> buffer(length + 1u, 0xEE);
        IO_STATUS_BLOCK ioStatus{};
        NTSTATUS result =
            ZwReadFile(file, nullptr, nullptr, nullptr, &ioStatus, buffer.data(), length, byteOffset, nullptr);
        EXPECT_EQ(ioStatus.Status, result);
        EXPECT_EQ(buffer[length], 0xEE) << "read past the buffer";
        EXPECT_LE(ioStatus.Information, length);
        buffer.resize(std::min<uintptr_t>(ioStatus.Information, length));
        return {result, buffer};
    }

    static NTSTATUS querySize(HANDLE file, FILE_STANDARD_INFORMATION& information, IO_STATUS_BLOCK& ioStatus)
    {
        return ZwQueryInformationFile(file, &ioStatus, &information, sizeof information, kFileStandardInformation);
    }

    static NTSTATUS setPosition(HANDLE file, int64_t position)
    {
        FILE_POSITION_INFORMATION information{};
        information.CurrentByteOffset.QuadPart = position;
        IO_STATUS_BLOCK ioStatus{};
        return ZwSetInformationFile(file, &ioStatus, &information, sizeof information, kFilePositionInformation);
    }

    // Checks the misuse reports, then forgets them so the fixture's final check passes.
    static void expectMisuseReported(size_t count, const std::string& mentioning)
    {
        EXPECT_EQ(sim::kernel::misuseReports().size(), count);
        for (const std::string& report : sim::kernel::misuseReports())
            EXPECT_NE(report.find(mentioning), std::string::npos) << report;
        sim::kernel::clearMisuseReports();
    }

  private:
    fs::path top_;
};

}  // namespace files_test
