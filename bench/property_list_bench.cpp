// Loading a registry of 5,000 fonts, beside one pass of the bare XML parser over the same bytes. Prints the
// ratios at the end: of processor time, the best of many rounds each, taken in turn so that a busy machine
// hits all alike.

#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <algorithm>
#include <cstdio>
#include <limits>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <expat.h>
#include <time.h>

namespace typhon {
namespace {

constexpr int fonts = 5'000;

PropertyList registryEntry(int index)
{
    const auto family = "Family " + std::to_string(index / 4);
    const auto postScript = "Family" + std::to_string(index / 4) + "-Style" + std::to_string(index % 4);
    return PropertyList::Dictionary{
        {"disabled", index % 7 == 0},
        {"familyName", PropertyList::Dictionary{{postScript, family}}},
        {"registeredBy", "com.example.provider" + std::to_string(index % 20)},
        {"scope", 2},
    };
}

PropertyList registry()
{
    PropertyList::Dictionary entries;
    for (int index = 0; index < fonts; ++index) {
        const auto provider = "com.example.provider" + std::to_string(index % 20);
        entries.emplace("/var/mobile/Library/UserFonts/" + provider + "/font-" + std::to_string(index) +
                            ".ttf",
                        registryEntry(index));
    }
    return PropertyList::Dictionary{{"fonts", std::move(entries)}, {"version", 1}};
}

struct Samples {
    PropertyList value = registry();
    std::string xml = writeXmlPropertyList(value);
    std::vector<std::uint8_t> binary = writeBinaryPropertyList(value);

    std::span<const std::uint8_t> xmlBytes() const
    {
        return {reinterpret_cast<const std::uint8_t*>(xml.data()), xml.size()};
    }
};

const Samples& samples()
{
    static const Samples samples;
    return samples;
}

XML_Status barePass()
{
    auto* parser = XML_ParserCreate(nullptr);
    const auto& xml = samples().xml;
    const auto status = XML_Parse(parser, xml.data(), static_cast<int>(xml.size()), 1);
    XML_ParserFree(parser);
    return status;
}

/// The same with handlers that do nothing: what any reader over this parser must pay.
XML_Status emptyHandlersPass()
{
    auto* parser = XML_ParserCreate(nullptr);
    XML_SetElementHandler(
        parser, [](void*, const XML_Char*, const XML_Char**) {}, [](void*, const XML_Char*) {});
    XML_SetCharacterDataHandler(parser, [](void*, const XML_Char*, int) {});
    const auto& xml = samples().xml;
    const auto status = XML_Parse(parser, xml.data(), static_cast<int>(xml.size()), 1);
    XML_ParserFree(parser);
    return status;
}

auto loadXml()
{
    return readPropertyList(samples().xmlBytes());
}
auto loadBinary()
{
    return readPropertyList(samples().binary);
}
auto saveXml()
{
    return writeXmlPropertyList(samples().value);
}
auto saveBinary()
{
    return writeBinaryPropertyList(samples().value);
}

/// Includes the release of what was made.
template <auto step>
void timed(benchmark::State& state)
{
    samples();
    for (auto _ : state)
        benchmark::DoNotOptimize(step());
}

BENCHMARK(timed<barePass>)->Name("bare XML pass")->Unit(benchmark::kMillisecond);
BENCHMARK(timed<emptyHandlersPass>)->Name("XML pass with empty handlers")->Unit(benchmark::kMillisecond);
BENCHMARK(timed<loadXml>)->Name("load XML")->Unit(benchmark::kMillisecond);
BENCHMARK(timed<loadBinary>)->Name("load binary")->Unit(benchmark::kMillisecond);
BENCHMARK(timed<saveXml>)->Name("save XML")->Unit(benchmark::kMillisecond);
BENCHMARK(timed<saveBinary>)->Name("save binary")->Unit(benchmark::kMillisecond);

/// Processor time of this thread.
double millisecondsNow()
{
    timespec now{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) * 1e3 + static_cast<double>(now.tv_nsec) / 1e6;
}

/// What `step` returns is released outside the measurement.
template <typename Step>
double millisecondsOf(Step step)
{
    const auto begin = millisecondsNow();
    [[maybe_unused]] const auto result = step();
    return millisecondsNow() - begin;
}

void printRatios()
{
    constexpr int rounds = 40;
    auto bare = std::numeric_limits<double>::max(), xml = bare, binary = bare;
    for (int round = 0; round < rounds; ++round) {
        bare = std::min(bare, millisecondsOf(barePass));
        xml = std::min(xml, millisecondsOf(loadXml));
        binary = std::min(binary, millisecondsOf(loadBinary));
    }
    std::printf("%d fonts: %zu bytes of XML, %zu bytes binary\n", fonts, samples().xml.size(),
                samples().binary.size());
    std::printf("load XML / bare XML pass: %.2f (%.2f ms, %.2f ms)\n", xml / bare, xml, bare);
    std::printf("load binary / load XML: %.2f (%.2f ms)\n", binary / xml, binary);
}

}  // namespace
}  // namespace typhon

int main(int count, char** arguments)
{
    benchmark::Initialize(&count, arguments);
    if (benchmark::ReportUnrecognizedArguments(count, arguments))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    typhon::printRatios();
    return 0;
}
