// The platform's configuration: what the location routines ask of it.
#include <sys/stat.h>

#include <array>

#include "platform/BuildConstants.h"
#include "tools/lfhelper/doctor/Checks.h"
#include "tools/lfhelper/doctor/FileFacts.h"
#include "tools/lfhelper/doctor/ServerAddress.h"

namespace lfhelper::doctor {
namespace {

using platform::PropertyList;

constexpr const char* kFolder = "configuration-folder";
constexpr const char* kFile = "configuration-file";

struct Key {
    const char* check;
    const char* name;
    const char* form;
    bool (*hasForm)(std::string_view text);
    const char* withoutIt;
};

bool IsAnyText(std::string_view /*text*/) {
    return true;
}

constexpr std::array kKeys{
    Key{"country-code", "CountryCode", "a text", IsAnyText, "there is no country code to tell"},
    Key{"geocoding-server",
        "ReverseGeocodeURL",
        "an http or https URL",
        IsHttpUrl,
        "civic addresses cannot be looked up"},
    Key{"stun-server",
        "StunServer",
        "a host or host:port",
        IsHostAndPort,
        "the public address cannot be looked up"},
};

Finding JudgeKey(const Key& key, const std::string& path, const PropertyList& entries) {
    const std::string name = key.name;
    const PropertyList* const value = entries.find(name);
    const auto* const text = value == nullptr ? nullptr : value->as<std::string>();
    if (value == nullptr || (text != nullptr && text->empty())) {
        return Note(key.check,
                    path + " has no " + name + ": " + key.withoutIt,
                    "give it that key with " + std::string(key.form));
    }
    if (text == nullptr || !key.hasForm(*text)) {
        return Problem(key.check,
                       name + " in " + path + " is not " + key.form + ": " + key.withoutIt,
                       "give it that key with " + std::string(key.form));
    }
    return Ok(key.check, name + " is \"" + *text + "\"");
}

Findings JudgeKeys(const std::string& path, const PropertyList& entries) {
    Findings findings{Ok(kFile, path + " can be read")};
    for (const Key& key : kKeys) {
        findings.push_back(JudgeKey(key, path, entries));
    }
    return findings;
}

Findings JudgeFile(const std::string& path) {
    const ConfigurationFile file = ReadConfigurationFile(path);
    switch (file.state) {
        case ConfigurationFile::State::kRead:
            return JudgeKeys(path, file.entries);
        case ConfigurationFile::State::kUnseen:
            return {Note(kFile, file.text, file.remedy)};
        case ConfigurationFile::State::kUseless:
            return {Problem(kFile, file.text + ": it counts as absent", file.remedy)};
        case ConfigurationFile::State::kAbsent:
            break;
    }
    return {Note(kFile,
                 file.text + ": location requests are answered with errors",
                 "put a property list there with CountryCode, ReverseGeocodeURL and StunServer")};
}

}  // namespace

Findings CheckConfiguration(const Subject& /*subject*/) {
    const std::string folder = platform::kConfigurationDirectory;
    const FileFacts facts = LookAt(folder);
    if (const std::string why = facts.isThere() ? WhyNotRootsOwn(facts, S_IFDIR) : "";
        !why.empty()) {
        return {Problem(kFolder,
                        folder + " " + why + ": the files in it count as absent",
                        MakeRootsOwn(folder))};
    }
    return JudgeFile(folder + "/platform.plist");
}

}  // namespace lfhelper::doctor
