#include "sweepKinds.h"

#include <sstream>

namespace lab {

namespace {

struct KindName {
    SweepKind kind;
    const char* name;
};

constexpr KindName kKinds[] = {
    {SweepKind::failedRequest, "failedRequest"},
    {SweepKind::unplug, "unplug"},
    {SweepKind::lostStatus, "lostStatus"},
    {SweepKind::readCorruption, "readCorruption"},
    {SweepKind::stuckBits, "stuckBits"},
    {SweepKind::shortRead, "shortRead"},
    {SweepKind::deadErase, "deadErase"},
    {SweepKind::allocation, "allocation"},
    {SweepKind::releaseFailure, "releaseFailure"},
    {SweepKind::registryOpen, "registryOpen"},
    {SweepKind::registryQuery, "registryQuery"},
    {SweepKind::registryOverflow, "registryOverflow"},
    {SweepKind::fileOpen, "fileOpen"},
    {SweepKind::fileRead, "fileRead"},
    {SweepKind::fileShortRead, "fileShortRead"},
    {SweepKind::fileSizeQuery, "fileSizeQuery"},
    {SweepKind::imageChange, "imageChange"},
};

}  // namespace

const char* sweepKindName(SweepKind kind)
{
    for (const KindName& entry : kKinds) {
        if (entry.kind == kind) return entry.name;
    }
    return "?";
}

std::optional<SweepKind> sweepKindNamed(const std::string& name)
{
    for (const KindName& entry : kKinds) {
        if (name == entry.name) return entry.kind;
    }
    return std::nullopt;
}

const std::vector<SweepKind>& allSweepKinds()
{
    static const std::vector<SweepKind> kinds = [] {
        std::vector<SweepKind> all;
        for (const KindName& entry : kKinds) all.push_back(entry.kind);
        return all;
    }();
    return kinds;
}

SweepKindChoice chooseSweepKinds(const std::string& text)
{
    SweepKindChoice choice;
    if (text == "all") {
        choice.kinds = allSweepKinds();
        return choice;
    }
    if (text == "none") return choice;
    std::stringstream names(text);
    std::string name;
    while (std::getline(names, name, ',')) {
        std::optional<SweepKind> kind = sweepKindNamed(name);
        if (!kind) {
            choice.unknown = name;
            return choice;
        }
        choice.kinds.push_back(*kind);
    }
    return choice;
}

}  // namespace lab
