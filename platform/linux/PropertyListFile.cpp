#include "platform/linux/PropertyListFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/Assertion.h"
#include "platform/PropertyListXml.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/ReplacementFile.h"
#include "platform/linux/WholeFile.h"

namespace platform {
namespace {

using Contents = PropertyListFile::Contents;
using State = PropertyListFile::State;

/// One name for all files of a folder: whatever a crash leaves behind, the next write removes.
constexpr const char* kTemporaryName = ".linefold-mobile-helper.tmp";
constexpr const char* kNotRegular = "is not a regular file";

std::string ErrorText(int error) {
    return strerrordesc_np(error);
}

Contents Unusable(State state, std::string complaint) {
    return {.state = state, .complaint = std::move(complaint)};
}

Contents NotOpened(int error, PropertyListFile::Links links) {
    if (error == ENOENT) {
        return {};
    }
    const bool isLink = error == ELOOP && links == PropertyListFile::Links::kRefused;
    return Unusable(State::kUnreadable,
                    isLink ? kNotRegular : "cannot be read: " + ErrorText(error));
}

std::string KeptName(const std::string& name) {
    return name + ".damaged";
}

/// Gives the damaged file a second name, since the new one is about to take its first. One that was
/// kept earlier goes.
int KeepDamaged(int folder, const std::string& name) {
    const std::string kept = KeptName(name);
    if (unlinkat(folder, kept.c_str(), 0) != 0 && errno != ENOENT) {
        return errno;
    }
    if (linkat(folder, name.c_str(), folder, kept.c_str(), 0) == 0) {
        return 0;
    }
    // Where it may not have two names, as a file of somebody else's, it changes its one. Should the
    // system stop now, the file counts as empty, as it did.
    return renameat(folder, name.c_str(), folder, kept.c_str()) == 0 ? 0 : errno;
}

}  // namespace

Contents PropertyListFile::read(Links links) const {
    // Whatever it is, opening it must not wait: a FIFO without a writer would hold us for ever.
    const int refusal = links == Links::kRefused ? O_NOFOLLOW : 0;
    const OwnedFd file(
        openat(folder_, name_.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC | refusal));
    if (!file.isOpen()) {
        return NotOpened(errno, links);
    }

    struct stat status {};

    if (fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
        return Unusable(State::kUnreadable, kNotRegular);
    }
    std::vector<std::byte> bytes;
    const bool isTooLarge = status.st_size > static_cast<off_t>(kPropertyListLimits.bytes);
    const int error =
        isTooLarge
            ? EFBIG
            : ReadWhole(
                  file, static_cast<std::size_t>(status.st_size), kPropertyListLimits.bytes, bytes);
    if (error != 0) {
        return Unusable(State::kUnreadable, "cannot be read: " + ErrorText(error));
    }
    auto entries = PropertyListCreateWithData(bytes);
    if (!entries || entries->kind() != PropertyList::Kind::kDictionary) {
        return Unusable(State::kDamaged, "is damaged: it holds no property list with a dictionary");
    }
    return {.state = State::kRead, .entries = std::move(*entries), .fileSize = bytes.size()};
}

std::string PropertyListFile::replace(const Contents& contents, mode_t mode) const {
    PLATFORM_ASSERT(contents.state != State::kUnreadable);
    if (!XmlPropertyListSize(contents.entries)) {
        return "cannot be written: it would hold more than 16 MiB or 200,000 objects, or "
               "characters that XML cannot hold";
    }
    ReplacementFile replacement(folder_, kTemporaryName);
    int error = replacement.make(mode, [&contents](const ReplacementFile::Put& put) {
        WriteXmlPropertyList(contents.entries, put);
    });
    if (error == 0 && contents.state == State::kDamaged) {
        error = KeepDamaged(folder_, name_);
    }
    if (error == 0) {
        error = replacement.takePlace(name_);
    }
    return error == 0 ? std::string() : "cannot be written: " + ErrorText(error);
}

bool PropertyListFile::removeKept() const {
    bool isRemoved = false;
    for (const std::string& name : {KeptName(name_), std::string(kTemporaryName)}) {
        if (unlinkat(folder_, name.c_str(), 0) == 0) {
            isRemoved = true;
        } else if (errno != ENOENT) {
            return false;
        }
    }
    return !isRemoved || SyncFolder(folder_) == 0;
}

}  // namespace platform
