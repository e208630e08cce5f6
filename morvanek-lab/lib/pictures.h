// Pictures of a run for people, as plain SVG: per device a map of its flash
// and a timeline of its updates on the bus model, and one timeline of all the
// devices on one time axis, so that a queue of updates shows at a glance.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "busTimeline.h"
#include "lab.h"

namespace lab {

// What the run did to one device's 64 KiB, page by page.
std::string flashMapSvg(const RunRecord& record, int device, const std::string& title);

// The devices' requests on the run's one time axis (0 to timeline.total),
// whichever devices are drawn, so that pictures of single devices line up.
std::string timelineSvg(const RunRecord& record, const BusTimeline& timeline, const std::vector<int>& devices,
                        const std::string& title);

// Writes FOLDER/<scenario>/timeline.svg and, per device, <device>-flash.svg
// and <device>-timeline.svg; returns the files written. Throws LabError when
// one cannot be written. A scenario that did not run has no pictures.
std::vector<std::filesystem::path> writePictures(const ScenarioResult& result, const std::filesystem::path& folder);

// For the command line: writes the pictures and returns a line that says
// where they are, or turns a failure into the scenario's lab error.
std::string writePicturesOf(ScenarioResult& result, const std::filesystem::path& folder);

}  // namespace lab
