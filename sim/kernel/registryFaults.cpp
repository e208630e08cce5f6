#include <stdexcept>

#include "kernelUtf16.h"
#include "registryKeyTree.h"
#include "registrySim.h"

namespace sim::kernel {

namespace {

template <typename Key, typename Faults>
void addFault(Faults& faults, const Key& key, NTSTATUS status, uint64_t number)
{
    // A "fault" that succeeds would hand the module no handle or an unfilled record.
    if (status >= 0) throw std::invalid_argument("a registry fault needs a failure status");
    auto& entry = faults[key];
    if (number == 0) {
        entry.everyCall = status;
    } else {
        entry.byNumber[entry.calls + number] = status;
    }
}

}  // namespace

template <typename Key>
NTSTATUS Registry::injectedFailure(std::map<Key, CallFaults>& faults, const Key& key)
{
    auto found = faults.find(key);
    if (found == faults.end()) return 0;
    CallFaults& entry = found->second;
    auto numbered = entry.byNumber.find(++entry.calls);
    return numbered != entry.byNumber.end() ? numbered->second : entry.everyCall;
}

template NTSTATUS Registry::injectedFailure(std::map<std::u16string, CallFaults>&, const std::u16string&);
template NTSTATUS Registry::injectedFailure(std::map<std::pair<std::u16string, std::u16string>, CallFaults>&,
                                            const std::pair<std::u16string, std::u16string>&);

void Registry::failCreateKey(const std::string& path, NTSTATUS status, uint64_t number)
{
    addFault(createFaults_, foldedPath(controlPath(path)), status, number);
}

void Registry::failQuery(const std::string& keyPath, const std::string& valueName, NTSTATUS status, uint64_t number)
{
    addFault(queryFaults_, std::make_pair(foldedPath(controlPath(keyPath)), folded(toUtf16(valueName))), status, number);
}

void Registry::clearFaults()
{
    createFaults_.clear();
    queryFaults_.clear();
}

}  // namespace sim::kernel
