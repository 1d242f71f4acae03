#include "loaded_registry.h"

#include "sample_registry.h"

namespace typhon::bench {

namespace {

Task<void> read(UserFontRegistry& registry)
{
    registry.isUserFontInstalled();
    co_return;
}

}  // namespace

LoadedRegistry::LoadedRegistry(int fonts)
{
    simulated_.fileSystem.addFile(UserFontRegistry::path, sampleRegistry(fonts));
    load();
}

void LoadedRegistry::load()
{
    simulated_.run(read(registry_));
}

}  // namespace typhon::bench
