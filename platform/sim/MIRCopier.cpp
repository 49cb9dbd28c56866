#include "platform/MIRCopier.h"

#include <cerrno>
#include <map>

#include "platform/sim/SimArchives.h"
#include "platform/sim/World.h"

namespace platform {

struct MIRCopier {
    MIRCopierFileErrorHandler fileError = nullptr;
    MIRCopierFatalErrorHandler fatalError = nullptr;
};

}  // namespace platform

namespace sim {
namespace {

struct Archives {
    bool hasCopier = true;
    std::map<std::string, ArchiveSource, std::less<>> sources;
    std::vector<ArchiveCopy> copies;
    std::size_t copiers = 0;
};

Archives& TheArchives() {
    static Archives& archives = *new Archives;
    return archives;
}

}  // namespace

void ResetArchives() {
    Archives fresh;
    fresh.copiers = TheArchives().copiers;  // they outlive a world, as all of our memory does
    TheArchives() = std::move(fresh);
}

void ProvideArchive(std::string_view path, ArchiveSource source) {
    TheArchives().sources.insert_or_assign(std::string(path), std::move(source));
}

void RemoveArchiveCopier() {
    TheArchives().hasCopier = false;
}

const std::vector<ArchiveCopy>& ArchiveCopies() {
    return TheArchives().copies;
}

std::size_t ArchiveCopiers() {
    return TheArchives().copiers;
}

}  // namespace sim

namespace platform {
namespace {

int End(MIRCopier* copier, const char* path, int error) {
    if (copier->fatalError != nullptr) {
        copier->fatalError(copier, path, error);
    }
    return error;
}

bool Skips(MIRCopier* copier, const sim::FailingFile& file) {
    return copier->fileError != nullptr &&
           copier->fileError(copier, file.path.c_str(), file.error) == kMIRCopierSkipFile;
}

}  // namespace

MIRCopier* MIRCopierNew() {
    if (sim::CallFails("MIRCopierNew") || !sim::TheArchives().hasCopier) {
        return nullptr;
    }
    ++sim::TheArchives().copiers;
    return new MIRCopier;
}

void MIRCopierFree(MIRCopier* copier) {
    sim::NoteCall("MIRCopierFree");
    --sim::TheArchives().copiers;
    delete copier;
}

void MIRCopierSetFileErrorHandler(MIRCopier* copier, MIRCopierFileErrorHandler handler) {
    sim::NoteCall("MIRCopierSetFileErrorHandler");
    copier->fileError = handler;
}

void MIRCopierSetFatalFileErrorHandler(MIRCopier* copier, MIRCopierFatalErrorHandler handler) {
    sim::NoteCall("MIRCopierSetFatalFileErrorHandler");
    copier->fatalError = handler;
}

int MIRCopierCopyWithOptions(MIRCopier* copier,
                             const char* source,
                             const char* destination,
                             const PropertyList& options) {
    if (sim::CallFails("MIRCopierCopyWithOptions",
                       std::string(source) + " -> " + std::string(destination))) {
        return End(copier, source, EIO);
    }
    auto& archives = sim::TheArchives();
    archives.copies.push_back({source, destination, options});
    const auto found = archives.sources.find(std::string_view(source));
    if (found == archives.sources.end()) {
        return End(copier, source, ENOENT);
    }
    for (const sim::FailingFile& file : found->second.failing) {
        if (!Skips(copier, file)) {
            return file.error;
        }
    }
    return found->second.fatal == 0 ? 0 : End(copier, source, found->second.fatal);
}

}  // namespace platform
