#include "registrySim.h"

#include "registryKeyTree.h"
#include "kernelUtf16.h"

namespace sim::kernel {

void Registry::failCreateKey(const std::string& path, NTSTATUS status)
{
    createFaults_[foldedPath(controlPath(path))] = status;
}

void Registry::failQuery(const std::string& keyPath, const std::string& valueName, NTSTATUS status)
{
    queryFaults_[{foldedPath(controlPath(keyPath)), folded(toUtf16(valueName))}] = status;
}

void Registry::clearFaults()
{
    createFaults_.clear();
    queryFaults_.clear();
}

}  // namespace sim::kernel
