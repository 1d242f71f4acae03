// Placing the names of a document's fonts, and building the indexes that do it.

#include "loaded_registry.h"
#include "platform/linux/linux_file_system.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"
#include "requests/font_name_resolution.h"
#include "rows.h"
#include "sample_registry.h"

#include <algorithm>
#include <random>
#include <stdexcept>
#include <string>
#include <unordered_map>
#include <vector>

namespace typhon::bench {

namespace {

/// So many lookups are measured together, each of another name.
constexpr int batch = 1'000;

/// So many names of a registry's, spread over it, in an order that no cache can foresee.
std::vector<std::string> chosenNames(int fonts, int count, std::string (*nameOf)(int))
{
    std::vector<std::string> names;
    names.reserve(static_cast<std::size_t>(count));
    for (int index = 0; index < count; ++index) {
        names.push_back(nameOf(index * (fonts / count)));
    }
    std::ranges::shuffle(names, std::mt19937_64(1));
    return names;
}

/// Seconds for one lookup: goes through the names from batch to batch. A name that is not found is a fault.
template <class Find>
Step lookups(const std::vector<std::string>& names, Find find)
{
    return [&names, find, next = std::size_t(0)]() mutable {
        int found = 0;
        const auto begin = secondsNow();
        for (int count = 0; count < batch; ++count) {
            found += find(names[next++ % names.size()]) ? 1 : 0;
        }
        const auto seconds = secondsNow() - begin;
        if (found != batch) {
            throw std::runtime_error("a name was not found");
        }
        return seconds / batch;
    };
}

/// A registry, its names, and the same names in a plain table.
class Names {
public:
    /// Of `fonts` faces; `asked` of their names are asked for, again and again.
    Names(int fonts, int asked)
        : families_(chosenNames(fonts, asked, sampleFamilyName)),
          faces_(chosenNames(fonts, asked, samplePostScriptName)), registry_(fonts),
          resolution_(registry_.registry(), registry_.device().userFontManager)
    {
        for (int index = 0; index < fonts; ++index) {
            table_.emplace(sampleFamilyName(index), sampleFamilyName(index));
            table_.emplace(samplePostScriptName(index), sampleFamilyName(index));
        }
    }

    Step placeFamily()
    {
        return lookups(families_, [this](const std::string& name) {
            bool isEnabled = false;
            return resolution_.isKnownFamilyName(name, &isEnabled);
        });
    }
    Step placeFace()
    {
        return lookups(faces_, [this](const std::string& name) {
            bool isEnabled = false;
            return resolution_.knownFamilyNameFromPostScriptName(name, &isEnabled).has_value();
        });
    }
    Step findFamily() { return lookups(families_, finding()); }
    Step findFace() { return lookups(faces_, finding()); }

private:
    std::function<bool(const std::string&)> finding()
    {
        return [this](const std::string& name) { return table_.find(name) != table_.end(); };
    }

    std::vector<std::string> families_;
    std::vector<std::string> faces_;
    LoadedRegistry registry_;
    FontNameResolution resolution_;
    std::unordered_map<std::string, std::string> table_;
};

void measurePlacing(Report& report)
{
    // Documents ask for few of the fonts there are. Where they ask for all in turn, memory is what is slow.
    Names small(5'000, batch);
    Names large(50'000, batch);
    const Effort effort{.rounds = 20, .steps = 10, .warmUp = 100};
    const char* peer = "bare lookup of that string in a `std::unordered_map`";
    report.add({"placing a family name, 5,000 faces", peer,
                compare(small.placeFamily(), small.findFamily(), effort), 3});
    report.add({"placing a PostScript name, 5,000 faces", peer,
                compare(small.placeFace(), small.findFace(), effort), 3});
    report.add({"placing a family name, 50,000 faces", peer,
                compare(large.placeFamily(), large.findFamily(), effort), 3});
    report.add({"placing a PostScript name, 50,000 faces", peer,
                compare(large.placeFace(), large.findFace(), effort), 3});
    report.add({"placing a family name, 50,000 faces", "the same with 5,000 faces",
                compare(large.placeFamily(), small.placeFamily(), effort), 1.5});
    report.add({"placing a PostScript name, 50,000 faces", "the same with 5,000 faces",
                compare(large.placeFace(), small.placeFace(), effort), 1.5});
    Names all(50'000, 50'000);
    const auto every = compare(all.placeFace(), all.findFace(), effort);
    report.addFigure("Placing all PostScript names of 50,000 faces in turn, each", every.ours);
    report.addFigure("The bare lookup of those", every.peer);
}

void measureIndexes(Report& report)
{
    const ScratchDirectory folder;
    const auto bytes = writeBinaryPropertyList(sampleRegistry(50'000));
    folder.writeFile("/registry.plist", {reinterpret_cast<const char*>(bytes.data()), bytes.size()});
    LinuxFileSystem files{RootDirectory(folder.path())};
    const auto load = [&] { return files.readPropertyList("/registry.plist"); };
    // Each construction takes a registry that was just read, as in the daemon.
    const Step construction = [&] {
        auto reading = load();
        return timed([&] { return std::make_unique<RegistrySnapshot>(*std::move(reading.value)); })();
    };
    report.add({"construction of the indexes, 50,000 faces", "loading that registry",
                compare(construction, timed(load), {.rounds = 12, .steps = 1, .warmUp = 1}), 0.5});
}

}  // namespace

void measureNames(Report& report)
{
    Report::begin("Placing names");
    measurePlacing(report);
    Report::begin("Building indexes");
    measureIndexes(report);
}

}  // namespace typhon::bench
