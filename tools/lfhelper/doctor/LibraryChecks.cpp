// The libraries that the service loads when it needs them, from a folder of root's.
#include <sys/stat.h>

#include <array>

#include "platform/BuildConstants.h"
#include "tools/lfhelper/doctor/Checks.h"
#include "tools/lfhelper/doctor/FileFacts.h"

namespace lfhelper::doctor {
namespace {

constexpr const char* kFolder = "library-directory";

enum class Origin : bool { kOurs, kOthers };

struct Library {
    const char* check;
    const char* file;
    Origin origin;
    const char* withoutIt;
};

constexpr std::array kLibraries{
    Library{"http-module",
            "libLinefoldHttp.so",
            Origin::kOurs,
            "neither service databases nor civic addresses can be fetched"},
    Library{"geocoder-module",
            "libLinefoldGeocoder.so",
            Origin::kOurs,
            "civic addresses cannot be looked up"},
    Library{
        "archive-module", "libLinefoldArchive.so", Origin::kOurs, "archives cannot be expanded"},
    Library{"radio-module",
            "libLinefoldRadio.so",
            Origin::kOurs,
            "the radio manager's logging cannot be switched"},
    Library{"visual-voicemail",
            "libVisualVoicemail.so",
            Origin::kOthers,
            "nobody is subscribed to visual voicemail"},
    Library{"baseband-helper",
            "libBasebandHelperServer.so",
            Origin::kOthers,
            "no baseband helper is hosted"},
};

Finding JudgeLibrary(const Library& library, const std::string& path, const FileFacts& facts) {
    if (facts.isUnseen()) {
        return Note(library.check, path + " cannot be seen: " + facts.error, "run this as root");
    }
    if (facts.isAbsent()) {
        const std::string text = path + " is not there: " + library.withoutIt;
        return library.origin == Origin::kOurs
                   ? Note(library.check, text, "install it, should that be needed")
                   : Ok(library.check, text);
    }
    const std::string why = WhyNotRootsOwn(facts, S_IFREG);
    return why.empty()
               ? Ok(library.check, path + " can be loaded")
               : Problem(
                     library.check, path + " " + why + ": it is not loaded", MakeRootsOwn(path));
}

}  // namespace

Findings CheckLibraries(const Subject& /*subject*/) {
    const std::string folder = platform::kLibraryDirectory;
    const FileFacts facts = LookAt(folder);
    if (const std::string why = facts.isThere() ? WhyNotRootsOwn(facts, S_IFDIR) : "";
        !why.empty()) {
        return {Problem(
            kFolder, folder + " " + why + ": nothing in it is loaded", MakeRootsOwn(folder))};
    }
    Findings findings;
    for (const Library& library : kLibraries) {
        const std::string path = folder + "/" + library.file;
        findings.push_back(JudgeLibrary(library, path, LookAt(path)));
    }
    return findings;
}

}  // namespace lfhelper::doctor
