#include "platform/linux/ArchiveModule.h"

#include <locale.h>

#include "platform/linux/ArchiveExpansion.h"

namespace {

/// Names in archives are UTF-8, and the library converts them to the thread's locale. The process
/// keeps its own.
class Utf8Names {
public:
    Utf8Names()
        : locale_(newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr)),
          before_(uselocale(locale_)) {}  // a null locale changes nothing

    ~Utf8Names() {
        (void)uselocale(before_);
        if (locale_ != nullptr) {
            freelocale(locale_);
        }
    }

    Utf8Names(const Utf8Names&) = delete;
    Utf8Names& operator=(const Utf8Names&) = delete;

private:
    const locale_t locale_;
    const locale_t before_;
};

}  // namespace

extern "C" __attribute__((visibility("default"))) int LinefoldArchiveExpand(
    int archive, int directory, const LinefoldArchiveHandlers* handlers) noexcept {
    const Utf8Names utf8Names;
    return platform::ExpandArchive(
        archive,
        directory,
        {.entryFailed =
             [&](const std::string& name, const platform::ArchiveError& error) {
                 return handlers->entryFailed(
                            handlers->context, name.c_str(), error.code, error.reason.c_str()) != 0;
             },
         .archiveFailed =
             [&](const platform::ArchiveError& error) {
                 handlers->archiveFailed(handlers->context, error.code, error.reason.c_str());
             }});
}
