// MIRCopier: the system's archive copier, which expands ZIP archives and copies anything else.
#pragma once

#include <memory>

#include "platform/PropertyList.h"

namespace platform {

/// A copier and the handlers that it was given; known to its maker only.
struct MIRCopier;

// The keys of the options, each a boolean; an absent one is false.

/// A source whose first bytes are those of a ZIP archive is expanded, not copied.
inline constexpr const char* kMIRCopierExtractPKZip = "extractPKZip";
/// Understood and not needed: the user's own attributes, among them what is a resource fork
/// elsewhere, are part of every copy here.
inline constexpr const char* kMIRCopierCopyExtendedAttributes = "copyExtendedAttributes";
inline constexpr const char* kMIRCopierCopyResources = "copyResources";

/// What a file-error handler answers: leave this file out and go on. Every other value ends it.
inline constexpr int kMIRCopierSkipFile = 2;

/// Asked for each file or entry that cannot be made, by its name inside the source. `error` is an
/// errno value. Without a handler such a file ends the copy.
using MIRCopierFileErrorHandler = int (*)(MIRCopier* copier, const char* path, int error);

/// Told once, before the copy ends, of what no single file can be blamed for.
using MIRCopierFatalErrorHandler = void (*)(MIRCopier* copier, const char* path, int error);

/// A new copier, which the caller frees; null where this system has none.
[[nodiscard]] MIRCopier* MIRCopierNew();

void MIRCopierFree(MIRCopier* copier);

void MIRCopierSetFileErrorHandler(MIRCopier* copier, MIRCopierFileErrorHandler handler);
void MIRCopierSetFatalFileErrorHandler(MIRCopier* copier, MIRCopierFatalErrorHandler handler);

/// Copies the source to the destination, on the caller's thread. 0, also when files were left out
/// by the handler's choice; otherwise an errno value.
///
/// An archive, and what a directory contains, go into the destination, which is made with the
/// folders above it if it is missing; what is there already stays, but for files of the same name.
/// A file takes the place of the destination, or goes inside it if that is a directory; a link to a
/// file is copied as a link. Both paths are resolved by the rule of PathAccess, and what they lead
/// to is held open: nothing outside of the destination is touched, whatever is moved or linked
/// below it meanwhile. What is made belongs to this process; copies keep what those of
/// FileManagerCopyItem keep.
///
/// Of an archive only regular files, directories and symbolic links are expanded, with the modes
/// that 0755 leaves, and each file is complete or not there. An entry is left out or ends the copy,
/// as the handler says, when it is damaged, its name is empty, absolute, not of this system (a
/// backslash, a control character) or leads through ".." or a link, and when it is a link that is
/// absolute or leads out. Fatal are a source that cannot be read, is no archive in spite of its
/// first bytes, or is neither file nor directory nor link, a destination that cannot be made, a
/// full or broken disk, and an archive of more than 100,000 entries or 1 GiB: what was expanded
/// until then stays.
[[nodiscard]] int MIRCopierCopyWithOptions(MIRCopier* copier,
                                           const char* source,
                                           const char* destination,
                                           const PropertyList& options);

struct MIRCopierDeleter {
    void operator()(MIRCopier* copier) const { MIRCopierFree(copier); }
};

using OwnedMIRCopier = std::unique_ptr<MIRCopier, MIRCopierDeleter>;

}  // namespace platform
