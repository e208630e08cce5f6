// The progress display: on standard error only, never faster than a person
// can read, plain lines where TERM is dumb, and every phase of an update with
// its total.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>

#include "morvanek-lab/lib/lab.h"
#include "morvanek-lab/lib/progress.h"
#include "morvanek-lab/lib/scenarioParser.h"

namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

// What a display wrote, and a clock the test moves.
class Display {
public:
    explicit Display(lab::Progress::Style style)
        : file_(std::tmpfile()), progress_(file_, style, [this] { return now; })
    {
    }
    ~Display() { std::fclose(file_); }

    std::string written() const
    {
        std::fflush(file_);
        std::string text;
        std::rewind(file_);
        for (int c; (c = std::fgetc(file_)) != EOF;) text += static_cast<char>(c);
        return text;
    }
    lab::Progress& progress() { return progress_; }

    Clock::time_point now{};

private:
    std::FILE* file_;
    lab::Progress progress_;
};

TEST(Progress, WaitsBeforeItsFirstLineAndRedrawsNoFasterThanItsInterval)
{
    Display display(lab::Progress::Style::redraw);
    lab::Progress& progress = display.progress();
    progress.show("a");  // starts the clock
    display.now += 100ms;
    progress.show("b");
    EXPECT_EQ(display.written(), "") << "a run this short shows nothing";
    display.now += 200ms;
    progress.show("c");
    display.now += 100ms;
    EXPECT_FALSE(progress.due());
    progress.show("d");
    display.now += 300ms;
    progress.show("e");
    progress.clear();
    EXPECT_EQ(display.written(), "\r\033[Kc\r\033[Ke\r\033[K");
}

TEST(Progress, ADumbTerminalGetsPlainLinesAtALowerRate)
{
    EXPECT_EQ(lab::Progress::styleFor("dumb"), lab::Progress::Style::lines);
    EXPECT_EQ(lab::Progress::styleFor("xterm-256color"), lab::Progress::Style::redraw);
    EXPECT_EQ(lab::Progress::styleFor(nullptr), lab::Progress::Style::redraw);

    Display display(lab::Progress::Style::lines);
    lab::Progress& progress = display.progress();
    progress.show("a");
    for (const char* line : {"b", "c", "d", "e"}) {
        display.now += 1s;
        progress.show(line);
    }
    progress.clear();
    EXPECT_EQ(display.written(), "c\ne\n");
}

// Every phase of an update shows with its total when the clock lets each
// request be drawn.
TEST(Progress, ShowsEachPhaseOfAnUpdateWithItsTotal)
{
    const char* scenario = R"({
      "registry": { "keys": { "HKLM\\Software\\Microsoft\\Windows NT\\CurrentVersion": { "SystemRoot": "C:\\WINDOWS" } } },
      "drives": { "C": { "files": { "WINDOWS\\system32\\drivers\\QVUSB4B01.bin": { "generate": { "size": 1500 } } } } },
      "devices": [{ "name": "d", "identity": { "productId": "0x4B01" } }]
    })";
    // Each look at the clock is a minute later, so every request is drawn.
    std::FILE* file = std::tmpfile();
    Clock::time_point now{};
    lab::Progress progress(file, lab::Progress::Style::lines, [&now] { return now += std::chrono::minutes(1); });
    lab::RunOptions options;
    options.progress = true;
    options.progressDisplay = &progress;
    options.scenarioNumber = 2;
    options.scenarioCount = 3;
    lab::ScenarioResult result = lab::runScenario(lab::parseScenarioText(scenario, "one.json", "."), options);
    EXPECT_EQ(result.exitCode(), 0) << result.invalid << result.labError;

    std::fflush(file);
    std::rewind(file);
    std::string text;
    for (int c; (c = std::fgetc(file)) != EOF;) text += static_cast<char>(c);
    std::fclose(file);
    for (const char* line : {"[2/3] one.json d: identity check\n", "[2/3] one.json d: erasing page 1 of 3\n",
                             "[2/3] one.json d: erasing page 3 of 3\n", "[2/3] one.json d: programming block 1 of 3\n",
                             "[2/3] one.json d: verifying block 3 of 3\n", "[2/3] one.json d: completion marker\n",
                             "[2/3] one.json d: restart\n"}) {
        EXPECT_NE(text.find(line), std::string::npos) << line << "in:\n" << text;
    }
    EXPECT_EQ(text.find('\033'), std::string::npos);
}

}  // namespace
