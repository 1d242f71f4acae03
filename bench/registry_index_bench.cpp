// The indexes of a registry, at 5,000 and at 50,000 faces: placing one name beside a bare hash lookup of the
// same string, and building the indexes beside loading the registry that they are built from. Names are asked
// for in random order, so that the processor's caches help no more than they would a daemon. Prints the
// ratios at the end: of processor time, the best of several rounds, taken in turn so that a busy machine hits
// all alike.

#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "registry/registry_cleaning.h"
#include "registry/registry_snapshot.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <limits>
#include <random>
#include <string>
#include <unordered_map>
#include <vector>

#include <benchmark/benchmark.h>
#include <time.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;

PropertyList registryOf(int faces)
{
    Dictionary entries;
    for (int index = 0; index < faces; ++index) {
        const auto number = std::to_string(index / 4);
        const auto style = std::to_string(index % 4);
        const auto provider = "com.example.provider" + std::to_string(index % 20);
        entries.emplace(
            "/var/mobile/Library/UserFonts/FontFiles/" + provider + "/font-" + std::to_string(index) + ".ttf",
            Dictionary{{"disabled", index % 7 == 0},
                       {"familyName", Dictionary{{"Family" + number + "-Style" + style, "Family " + number}}},
                       {"registeredBy", provider},
                       {"scope", 2}});
    }
    return entries;
}

/// Processor time of this thread.
double nanosecondsNow()
{
    timespec now{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) * 1e9 + static_cast<double>(now.tv_nsec);
}

/// What `step` returns is released outside the measurement.
template <typename Step>
double nanosecondsOf(Step step)
{
    const auto begin = nanosecondsNow();
    [[maybe_unused]] const auto result = step();
    return nanosecondsNow() - begin;
}

struct Sample {
    explicit Sample(int count) : faces(count), xml(writeXmlPropertyList(registryOf(count)))
    {
        for (const auto& [path, entry] : snapshot.entries()) {
            for (const auto& [postScriptName, familyName] : *entry.find("familyName")->asDictionary()) {
                postScriptNames.push_back(postScriptName);
                familyNames.push_back(*familyName.asString());
            }
        }
        for (auto* names : {&postScriptNames, &familyNames}) {
            for (const auto& name : *names) {
                bare.emplace(name, names);
            }
            std::shuffle(names->begin(), names->end(), random);
        }
    }

    PropertyList load() const
    {
        auto reading = readPropertyList({reinterpret_cast<const std::uint8_t*>(xml.data()), xml.size()});
        return cleanRegistry(*std::move(reading.value)).root;
    }

    int faces;
    std::string xml;
    std::mt19937_64 random{1};
    PropertyList loaded = load();
    RegistrySnapshot snapshot{loaded};
    std::vector<std::string> postScriptNames;
    std::vector<std::string> familyNames;
    std::unordered_map<std::string, const void*> bare;
};

const Sample& sample(int faces)
{
    static const Sample small(5'000);
    static const Sample large(50'000);
    return faces == small.faces ? small : large;
}

double bareLookup(const Sample& sample, const std::string& name)
{
    return sample.bare.find(name) == sample.bare.end() ? 1 : 0;
}

double placePostScriptName(const Sample& sample, const std::string& name)
{
    const auto* found = sample.snapshot.firstWithPostScriptName(name);
    return found == nullptr || !found->isEnabled ? 1 : 0;
}

double placeFamilyName(const Sample& sample, const std::string& name)
{
    const auto* found = sample.snapshot.firstWithFamilyName(name);
    return found == nullptr || !found->isEnabled ? 1 : 0;
}

/// Nanoseconds for one of `names`.
template <auto step>
double eachOf(const Sample& sample, const std::vector<std::string>& names)
{
    const auto all = nanosecondsOf([&] {
        double sum = 0;
        for (const auto& name : names) {
            sum += step(sample, name);
        }
        benchmark::DoNotOptimize(sum);
        return sum;
    });
    return all / static_cast<double>(names.size());
}

struct Times {
    static constexpr double none = std::numeric_limits<double>::max();
    double barePostScript = none, postScript = none, bareFamily = none, family = none, load = none,
           index = none;

    void takeRound(const Sample& sample)
    {
        const auto improve = [](double& best, double time) { best = std::min(best, time); };
        improve(barePostScript, eachOf<bareLookup>(sample, sample.postScriptNames));
        improve(postScript, eachOf<placePostScriptName>(sample, sample.postScriptNames));
        improve(bareFamily, eachOf<bareLookup>(sample, sample.familyNames));
        improve(family, eachOf<placeFamilyName>(sample, sample.familyNames));
        improve(load, nanosecondsOf([&] { return sample.load(); }));
        improve(index, nanosecondsOf([&] { return std::make_unique<RegistrySnapshot>(sample.loaded); }));
    }
};

void print(int faces, const Times& times)
{
    std::printf("%d faces: PostScript name / bare lookup: %.2f (%.1f ns, %.1f ns)\n", faces,
                times.postScript / times.barePostScript, times.postScript, times.barePostScript);
    std::printf("%d faces: family name / bare lookup: %.2f (%.1f ns, %.1f ns)\n", faces,
                times.family / times.bareFamily, times.family, times.bareFamily);
    std::printf("%d faces: indexes / load: %.2f (%.2f ms, %.2f ms)\n", faces, times.index / times.load,
                times.index / 1e6, times.load / 1e6);
}

void printRatios()
{
    constexpr int rounds = 15;
    Times small;
    Times large;
    for (int round = 0; round < rounds; ++round) {
        small.takeRound(sample(5'000));
        large.takeRound(sample(50'000));
    }
    print(5'000, small);
    print(50'000, large);
    std::printf("50,000 / 5,000 faces: PostScript name %.2f (bare %.2f), family name %.2f (bare %.2f)\n",
                large.postScript / small.postScript, large.barePostScript / small.barePostScript,
                large.family / small.family, large.bareFamily / small.bareFamily);
}

template <auto step>
void names(benchmark::State& state)
{
    const auto& chosen = sample(static_cast<int>(state.range(0)));
    std::size_t next = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(step(chosen, chosen.postScriptNames[next]));
        next = next + 1 == chosen.postScriptNames.size() ? 0 : next + 1;
    }
}

BENCHMARK(names<bareLookup>)->Name("bare lookup")->Arg(5'000)->Arg(50'000);
BENCHMARK(names<placePostScriptName>)->Name("place a PostScript name")->Arg(5'000)->Arg(50'000);

}  // namespace
}  // namespace typhon

int main(int count, char** arguments)
{
    benchmark::Initialize(&count, arguments);
    if (benchmark::ReportUnrecognizedArguments(count, arguments)) {
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    typhon::printRatios();
    return 0;
}
