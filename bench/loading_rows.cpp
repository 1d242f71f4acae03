// Reading a registry of 5,000 fonts, in both encodings.

#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "rows.h"
#include "sample_registry.h"

#include <string>
#include <vector>

#include <expat.h>
#include <time.h>

namespace typhon::bench {

namespace {

struct Samples {
    PropertyList value = sampleRegistry(5'000);
    std::string xml = writeXmlPropertyList(value);
    std::vector<std::uint8_t> binary = writeBinaryPropertyList(value);

    std::span<const std::uint8_t> xmlBytes() const
    {
        return {reinterpret_cast<const std::uint8_t*>(xml.data()), xml.size()};
    }
};

XML_Status barePass(const std::string& xml)
{
    auto* parser = XML_ParserCreate(nullptr);
    const auto status = XML_Parse(parser, xml.data(), static_cast<int>(xml.size()), 1);
    XML_ParserFree(parser);
    return status;
}

double processorSeconds()
{
    timespec now{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

/// Processor time of this thread alone: nothing here waits for anybody. With the release of the result.
template <class Work>
Step processorTimed(Work work)
{
    return [work] {
        const auto begin = processorSeconds();
        work();
        return processorSeconds() - begin;
    };
}

}  // namespace

void measureLoading(Report& report)
{
    Report::begin("Loading a registry");
    const Samples samples;
    const Step bare = processorTimed([&] { barePass(samples.xml); });
    const Step xml = processorTimed([&] { readPropertyList(samples.xmlBytes()); });
    const Step binary = processorTimed([&] { readPropertyList(samples.binary); });
    const Effort effort{.rounds = 30, .steps = 1, .warmUp = 2};
    report.add({"loading a registry of 5,000 entries, XML", "one bare expat pass over the same bytes",
                compare(xml, bare, effort), 2});
    report.add({"loading a registry of 5,000 entries, binary", "the XML load", compare(binary, xml, effort),
                1.0 / 3});
}

}  // namespace typhon::bench
