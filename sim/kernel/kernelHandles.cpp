#include "kernelHandles.h"

#include <cstdio>
#include <map>

#include "kernelLock.h"

namespace sim::kernel {
namespace {

struct OpenHandle {
    HandleKind kind;
    std::function<void()> onClose;
    std::string description;
};

struct HandleTable {
    std::map<intptr_t, OpenHandle> open;
    intptr_t next = -0x7FFFFF00;  // kernel handles: negative when sign-extended
    std::vector<std::string> misuse;
};

HandleTable& table()
{
    static HandleTable instance;
    return instance;
}

}  // namespace

HANDLE openHandle(HandleKind kind, std::function<void()> onClose, std::string description)
{
    HandleTable& t = table();
    intptr_t value = t.next;
    t.next += 4;
    t.open[value] = OpenHandle{kind, std::move(onClose), std::move(description)};
    return reinterpret_cast<HANDLE>(value);
}

const std::string* findHandle(HANDLE handle, HandleKind kind)
{
    auto it = table().open.find(reinterpret_cast<intptr_t>(handle));
    if (it == table().open.end() || it->second.kind != kind) return nullptr;
    return &it->second.description;
}

size_t openHandleCount()
{
    return table().open.size();
}

size_t openHandleCount(HandleKind kind)
{
    size_t count = 0;
    for (const auto& entry : table().open) count += entry.second.kind == kind;
    return count;
}

std::vector<std::string> openHandleDescriptions()
{
    std::vector<std::string> result;
    for (const auto& entry : table().open) result.push_back(entry.second.description);
    return result;
}

void reportMisuse(const std::string& what)
{
    std::fprintf(stderr, "kernel stand-in: %s\n", what.c_str());
    table().misuse.push_back(what);
}

const std::vector<std::string>& misuseReports()
{
    return table().misuse;
}

void clearMisuseReports()
{
    table().misuse.clear();
}

void resetHandles()
{
    table().open.clear();
    table().misuse.clear();
}

}  // namespace sim::kernel

extern "C" NTSTATUS ZwClose(HANDLE handle)
{
    std::lock_guard<std::recursive_mutex> callLock(sim::kernel::kernelCallLock());
    auto& open = sim::kernel::table().open;
    auto it = open.find(reinterpret_cast<intptr_t>(handle));
    if (it == open.end()) {
        char text[64];
        std::snprintf(text, sizeof text, "ZwClose of handle %p, which is not open", handle);
        sim::kernel::reportMisuse(text);
        return static_cast<NTSTATUS>(0xC0000008u);  // STATUS_INVALID_HANDLE
    }
    std::function<void()> onClose = std::move(it->second.onClose);
    open.erase(it);
    if (onClose) onClose();
    return kStatusSuccess;
}
