// The voicemail store on one property-list file in a folder that is root's own.
//
// The file is small and read anew by each call, so that what lies on disk counts and no token stays
// in memory. Nothing in a folder that somebody else may write is believed or written over.
#include "platform/MailboxStore.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <mutex>
#include <utility>

#include "platform/linux/Complaints.h"
#include "platform/linux/MailboxRecords.h"
#include "platform/linux/OwnedFd.h"
#include "platform/linux/PropertyListFile.h"

namespace platform {
namespace {

using Contents = PropertyListFile::Contents;
using State = PropertyListFile::State;

constexpr const char* kParent = "/private/var/db";
constexpr const char* kFolder = "/private/var/db/linefold";
constexpr const char* kName = "voicemail.plist";
constexpr const char* kPath = "/private/var/db/linefold/voicemail.plist";

/// Around reading and writing: two threads must not overwrite each other's changes.
constinit std::mutex storeMutex;

struct Folder {
    OwnedFd descriptor{};
    bool isMissing = false;
};

bool IsRootsOwn(const struct stat& status) {
    return status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

/// Opens the folder without making it. What somebody else could have put in it is not used: they
/// would read the tokens, or choose them.
Folder OpenFolder(Complaints& complaints) {
    OwnedFd folder(open(kFolder, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!folder.isOpen() && errno == ENOENT) {
        return {.isMissing = true};
    }
    if (!folder.isOpen() && errno != ENOTDIR) {
        complaints.add(kFolder, std::string("cannot be opened: ") + strerrordesc_np(errno));
        return {};
    }

    struct stat status {};

    if (!folder.isOpen() || fstat(folder.get(), &status) != 0 || !IsRootsOwn(status)) {
        complaints.add(kFolder, "must be a folder of root's own, so nothing in it is used");
        return {};
    }
    if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
        (void)fchmod(folder.get(), S_IRWXU);  // the file is closed to others in any case
    }
    return {.descriptor = std::move(folder)};
}

/// Makes the folder, so that it lasts.
Folder MakeFolder(Complaints& complaints) {
    (void)mkdir(kParent, S_IRWXU | S_IRGRP | S_IXGRP | S_IROTH | S_IXOTH);
    const OwnedFd parent(open(kParent, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!parent.isOpen() || (mkdir(kFolder, S_IRWXU) != 0 && errno != EEXIST) ||
        fsync(parent.get()) != 0) {
        complaints.add(kFolder, std::string("cannot be made: ") + strerrordesc_np(errno));
        return {};
    }
    return OpenFolder(complaints);
}

/// The store as one call finds it, with the lock held for as long as it lives.
class Store {
public:
    Store() : folder_(OpenFolder(complaints_)) {
        if (!folder_.descriptor.isOpen()) {
            return;
        }
        contents_ = file().read(PropertyListFile::Links::kRefused);
        if (auto found = MailboxRecordsOf(contents_.entries)) {
            records = std::move(*found);
        } else {
            contents_.state = State::kDamaged;
            contents_.complaint = "is damaged: it holds something other than tokens";
        }
        if (!contents_.complaint.empty()) {
            complaints_.add(kPath, contents_.complaint);
        }
    }

    Store(const Store&) = delete;
    Store& operator=(const Store&) = delete;
    ~Store() = default;

    [[nodiscard]] bool isDamaged() const { return contents_.state == State::kDamaged; }

    void complain(std::string_view text) { complaints_.add(kPath, text); }

    /// Makes the records what the store holds.
    void write() {
        if (contents_.state == State::kUnreadable) {
            return;  // it may hold tokens that are not to be lost
        }
        if (folder_.isMissing) {
            folder_ = MakeFolder(complaints_);
        }
        if (!folder_.descriptor.isOpen()) {
            return;
        }
        contents_.entries = PropertyListOf(records);
        const std::string complaint = file().replace(contents_, S_IRUSR | S_IWUSR);
        if (!complaint.empty()) {
            complain(complaint);
        }
    }

    void removeKept() {
        if (folder_.descriptor.isOpen() && !file().removeKept()) {
            complain("has damaged or unfinished copies beside it that cannot be removed");
        }
    }

    MailboxRecords records{};

private:
    [[nodiscard]] PropertyListFile file() const { return {folder_.descriptor.get(), kName}; }

    // The first to be born is the last to go: it logs when the lock is no longer held.
    Complaints complaints_{"voicemail"};
    const std::lock_guard<std::mutex> lock_{storeMutex};
    Folder folder_;
    Contents contents_{};
};

}  // namespace

void MailboxStoreSetToken(std::optional<std::string_view> token) {
    Store store;
    if (store.records.token != token) {
        store.records.token = token;
        store.write();
    }
}

void MailboxStoreSetTokenForKey(std::string_view key, std::string_view token) {
    Store store;
    if (std::string* const known = store.records.find(key)) {
        if (*known != token) {
            *known = token;
            store.write();
        }
    } else if (store.records.records.size() < kMostMailboxRecords) {
        store.records.records.push_back({std::string(key), std::string(token)});
        store.write();
    } else {
        store.complain("is full, so the token of one more key is not stored");
    }
}

std::optional<std::string> MailboxStoreCopyToken() {
    return Store().records.token;
}

std::optional<std::string> MailboxStoreCopyTokenForKey(std::string_view key) {
    const Store store;
    const std::string* const token = store.records.find(key);
    return token == nullptr ? std::nullopt : std::optional(*token);
}

void MailboxStoreRemoveAllRecords(std::uint32_t /*flags*/) {
    Store store;
    if (!store.records.records.empty() || store.isDamaged()) {
        store.records.records.clear();
        store.write();
    }
    store.removeKept();
}

}  // namespace platform
