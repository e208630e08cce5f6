// Reading a scenario with many registry keys: the reader must stay linear in
// the size of the text (a duplicate-key check that rescanned each object at
// every closing brace once took minutes for 27 MB). Run by hand:
//   build/default/bench/scenario_parse_benchmark
// The budget: 200,000 keys (about 40 MB of JSON) read in well under ten
// seconds; the complexity line should say N, not N^2.
#include <benchmark/benchmark.h>

#include <string>

#include <fmt/format.h>

#include "morvanek-lab/lib/scenarioParser.h"

namespace {

// Keys as a machine's registry export has them: one per device instance,
// each with a string and a number.
std::string scenarioWithKeys(int64_t count)
{
    std::string text = R"({"description": "many keys", "registry": {"keys": {)";
    for (int64_t i = 0; i < count; ++i) {
        text += fmt::format(R"({}"HKLM\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01\\{:08X}": )"
                            R"({{"Driver": "{{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}}\\{:04}", )"
                            R"("Count": {{"type": "REG_DWORD", "value": {}}}}})",
                            i == 0 ? "" : ",\n", i, i % 10000, i);
    }
    text += "}}, \"steps\": [\"load\", \"unload\"]}";
    return text;
}

void readScenarioWithKeys(benchmark::State& state)
{
    const std::string text = scenarioWithKeys(state.range(0));
    for (auto _ : state) {
        lab::Scenario scenario = lab::parseScenarioText(text, "keys.json", ".");
        benchmark::DoNotOptimize(scenario.registry.keys.data());
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(text.size()));
    state.SetComplexityN(state.range(0));
}

BENCHMARK(readScenarioWithKeys)->Arg(20000)->Arg(200000)->Unit(benchmark::kMillisecond)->Complexity();

}  // namespace

BENCHMARK_MAIN();
