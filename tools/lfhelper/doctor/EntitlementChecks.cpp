// Who may call: the group, and the file that grants it the entitlement.
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/BuildConstants.h"
#include "tools/lfhelper/doctor/Checks.h"
#include "tools/lfhelper/doctor/FileFacts.h"

namespace lfhelper::doctor {
namespace {

using platform::PropertyList;

constexpr const char* kGroup = "entitled-group";
constexpr const char* kFolder = "entitlement-folder";
constexpr const char* kFile = "entitlement-file";
constexpr const char* kCaller = "caller";
constexpr const char* kEntitlement = "com.vendra.Halvane.LinefoldHelper.allow";

Finding JudgeGroup(const std::string& name) {
    return getgrnam(name.c_str()) != nullptr
               ? Ok(kGroup, "the group " + name + " exists")
               : Problem(kGroup,
                         "there is no group " + name,
                         "systemd-sysusers, or choose another group by --group");
}

Finding JudgeFolder(const std::string& path, const FileFacts& facts) {
    if (facts.isUnseen()) {
        return Note(kFolder, path + " cannot be seen: " + facts.error, "run this as root");
    }
    if (facts.isAbsent()) {
        return Problem(
            kFolder, path + " is not there, so nobody is entitled", "mkdir -p '" + path + "'");
    }
    const std::string why = WhyNotRootsOwn(facts, S_IFDIR);
    return why.empty()
               ? Ok(kFolder, path + " is root's, and not writable by others")
               : Problem(kFolder, path + " " + why + ": it counts as absent", MakeRootsOwn(path));
}

Finding JudgeGrant(const std::string& path, const PropertyList& entries) {
    const PropertyList* const grant = entries.find(kEntitlement);
    if (grant != nullptr && *grant == PropertyList(true)) {
        return Ok(kFile, path + " grants " + std::string(kEntitlement));
    }
    return Problem(
        kFile, path + " does not grant " + kEntitlement, "give it that key with the boolean true");
}

Finding JudgeFile(const std::string& path) {
    const ConfigurationFile file = ReadConfigurationFile(path);
    switch (file.state) {
        case ConfigurationFile::State::kRead:
            return JudgeGrant(path, file.entries);
        case ConfigurationFile::State::kUnseen:
            return Note(kFile, file.text, file.remedy);
        case ConfigurationFile::State::kUseless:
            return Problem(kFile, file.text + ": it counts as absent", file.remedy);
        case ConfigurationFile::State::kAbsent:
            break;
    }
    return Problem(
        kFile,
        file.text + ", so the group is not entitled",
        "put a property list there that gives " + std::string(kEntitlement) + " the boolean true");
}

/// Root can take the group, others must have it.
Finding JudgeCaller(const std::string& groupName) {
    const group* const entry = getgrnam(groupName.c_str());
    if (entry != nullptr && getegid() == entry->gr_gid) {
        return Ok(kCaller, "this process runs in the group " + groupName);
    }
    return geteuid() == 0
               ? Ok(kCaller, "this process is root's, which can take the group " + groupName)
               : Note(kCaller,
                      "this process runs in the group " + std::to_string(getegid()) +
                          " and cannot take the group " + groupName,
                      "run this as root");
}

}  // namespace

Findings CheckEntitlement(const Subject& subject) {
    const std::string folder = std::string(platform::kConfigurationDirectory) + "/entitlements";
    Findings findings{
        JudgeGroup(subject.group), JudgeCaller(subject.group), JudgeFolder(folder, LookAt(folder))};
    if (findings.back().level == Level::kOk) {
        findings.push_back(JudgeFile(folder + "/" + subject.group + ".plist"));
    }
    return findings;
}

}  // namespace lfhelper::doctor
