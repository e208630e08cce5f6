// A registry for the image lookup: the system root set, helpers to read the
// module's UTF-16 buffers back.
#pragma once

#include <algorithm>
#include <functional>
#include <string>
#include <vector>

#include "kernel/ntkernel.h"
#include "sim/kernel/kernelUtf16.h"
#include "tests/support/LoaderWorld.h"

namespace location_test {

using testing_support::instanceKey;
using testing_support::kDeviceClassKey;
using testing_support::kSystemVersionKey;
using Prepare = std::function<void(sim::kernel::Registry&)>;

constexpr WCHAR kUntouched = u'#';

// The buffer's text up to its NUL; "<no NUL>" when it has none.
inline std::string textOf(const std::vector<WCHAR>& buffer)
{
    auto end = std::find(buffer.begin(), buffer.end(), WCHAR(0));
    if (end == buffer.end()) return "<no NUL>";
    return sim::kernel::toUtf8(buffer.data(), static_cast<size_t>(end - buffer.begin()));
}

// A buffer of that many characters, none of them a NUL.
inline std::vector<WCHAR> untouchedBuffer(size_t characters) { return std::vector<WCHAR>(characters, kUntouched); }

inline bool isUntouched(const std::vector<WCHAR>& buffer)
{
    return std::all_of(buffer.begin(), buffer.end(), [](WCHAR c) { return c == kUntouched; });
}

inline std::string repeat(char character, size_t count) { return std::string(count, character); }

class LocationWorld : public testing_support::WorldTest {
protected:
    void SetUp() override
    {
        WorldTest::SetUp();
        sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", "C:\\WINDOWS");
    }
};

}  // namespace location_test
