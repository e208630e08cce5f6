// Image files on drive C: for the module's own image functions, with every
// open they make seen by the create-file spy.
#pragma once

#include <string>

#include "createFileSpy.h"
#include "sim/host/simHost.h"
#include "source/FirmwareHeader.h"
#include "tests/support/LoaderWorld.h"

class ImageWorld : public testing_support::LoaderWorld {
protected:
    void SetUp() override
    {
        LoaderWorld::SetUp();
        create_file_spy::reset();
    }

    static std::u16string wide(const std::string& text) { return sim::utf8ToUtf16(text); }
};
