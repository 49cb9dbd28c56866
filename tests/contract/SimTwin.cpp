#include "platform/sim/Ports.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"
#include "tests/contract/Twin.h"

namespace twin {

void Reset() {
    sim::Reset();
}

void Spend(double seconds) {
    sim::Spend(seconds);
}

Pair MakePair() {
    auto pair = sim::MakeWatchPair();
    const int descriptor = sim::AddDescriptor(std::move(pair.passed));
    return {.descriptor = descriptor,
            .closeOther = [kept = std::move(pair.kept)]() mutable { kept.close(); }};
}

std::string Folder() {
    return "/tmp";
}

void PutFile(const std::string& path, const std::string& contents, std::uint32_t permissions) {
    sim::MakeFile(path, {.mode = sim::kRegular | permissions, .contents = contents});
}

void PutDirectory(const std::string& path) {
    sim::MakeDirectory(path);
}

void PutLink(const std::string& path, const std::string& target) {
    sim::MakeLink(path, target);
}

void PutFifo(const std::string& path) {
    sim::MakeFile(path, {.mode = sim::kFifo | 0644});
}

void RemoveFile(const std::string& path) {
    sim::RemoveFile(path);
}

std::optional<File> FileAt(const std::string& path) {
    const auto file = sim::FileAt(path);
    if (!file || !file->is(sim::kRegular)) {
        return std::nullopt;
    }
    return File{.contents = file->contents, .permissions = file->mode & 07777};
}

}  // namespace twin
