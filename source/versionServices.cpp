#include "versionServices.h"

#include "firmwareHeader.h"
#include "imageLocation.h"
#include "statusCodes.h"

namespace {

constexpr uint32_t kComparedHeaderRevision = 0x0200;
constexpr uint32_t kUncheckedImageType = 0xF0;

// A failure replaces any status that is not already a failure; success keeps
// a zero or positive status as it was.
void mergeResult(tStatus& status, tStatus result)
{
    if (result < 0) status = result;
}

}  // namespace

namespace nMORVANE_1_4 {

tSSVersion getCurrentVersion(tStatus& status)
{
    (void)status;
    return tSSVersion(kCurrentVersion);
}

tSSVersion getOldestCompatibleVersion(tStatus& status)
{
    (void)status;
    return tSSVersion(kOldestCompatibleVersion);
}

void compareVersion(const tSSVersion& newestVersion, const tSSVersion& oldestVersion, tStatus& status,
                    const char* component)
{
    if (status < 0) return;
    const uint32_t newest = newestVersion.packed();
    const uint32_t oldest = oldestVersion.packed();
    tStatus result = 0;
    if (newest < oldest) {
        result = kStatusRangeInverted;
    } else if (newest < kOldestCompatibleVersion) {
        result = kStatusInstalledTooNew;
    } else if (oldest > kCurrentVersion) {
        result = kStatusInstalledTooOld;
    }
    mergeResult(status, result);
    if (status >= 0) return;

    char oldestText[16];
    char newestText[16];
    char installedOldestText[16];
    char installedNewestText[16];
    oldestVersion.toString(oldestText);
    newestVersion.toString(newestText);
    tSSVersion(kOldestCompatibleVersion).toString(installedOldestText);
    tSSVersion(kCurrentVersion).toString(installedNewestText);
    if (component != nullptr) {
        ssprintf("[morvanek] version check failed with status = %d. Component '%s' desires the range %s - %s "
                 "however the installed range is %s - %s\n",
                 static_cast<int32_t>(status), component, oldestText, newestText, installedOldestText,
                 installedNewestText);
    } else {
        ssprintf("[morvanek] version check failed with status = %d. The calling component desires the range %s - %s "
                 "however the installed range is %s - %s\n",
                 static_cast<int32_t>(status), oldestText, newestText, installedOldestText, installedNewestText);
    }
}

}  // namespace nMORVANE_1_4

namespace nMORVANE_1_2 {

void compareFirmwareVersion(tSSVersion expectedVersion, uint16_t productId, tStatus& status)
{
    WCHAR path[kPathCharacters];
    buildDefaultImagePath0200(productId, path, status);
    if (status < 0) return;
    FirmwareHeader header;
    readFirmwareHeader(header, path, status);
    if (status < 0) return;

    if ((header.headerRevision & 0xFF00) != kComparedHeaderRevision) return;
    if (header.imageType == kUncheckedImageType) return;
    if (header.imageVersion > expectedVersion.packed()) {
        status = kStatusInstalledTooNew;
    } else if (header.imageVersion < expectedVersion.packed()) {
        status = kStatusInstalledTooOld;
    }
}

}  // namespace nMORVANE_1_2
