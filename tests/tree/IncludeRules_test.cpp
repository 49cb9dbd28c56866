// The folder list is the architecture: who may include what.
#include <gtest/gtest.h>

#include <algorithm>
#include <regex>

#include "tests/tree/SourceTree.h"

namespace {

struct Rule {
    const char* folder;
    std::vector<std::string> ours;     ///< prefixes of our own headers
    std::vector<std::string> systems;  ///< system headers beside the C++ library; "*" for any
};

const std::vector<std::string> kPosixFiles{"fcntl.h", "sys/stat.h", "sys/types.h", "unistd.h"};
constexpr const char* kHost = "Helper/Shared/Server/";
constexpr const char* kPathPolicy = "handlers/carrier/PathPolicy.h";
constexpr const char* kMobileUser = "handlers/carrier/MobileUser.h";

// The longest folder that a file lies in decides.
const std::vector<Rule> kRules{
    {"platform/", {"platform/"}, {}},
    {"platform/hvu/", {"platform/"}, {"zlib.h"}},
    {"platform/linux/", {"platform/"}, {"*"}},
    {"platform/sim/", {"platform/"}, {}},
    {"Helper/Shared/Server/", {"platform/", kHost}, kPosixFiles},
    {"handlers/carrier/", {"platform/", kHost, "handlers/carrier/"}, kPosixFiles},
    {"handlers/files/",
     {"platform/", kHost, "handlers/files/", kPathPolicy, kMobileUser},
     kPosixFiles},
    {"handlers/voicemail/", {"platform/", kHost, "handlers/voicemail/"}, kPosixFiles},
    {"location/", {"platform/", kHost, "location/"}, kPosixFiles},
    {"heartbeat/", {"platform/", kHost, "heartbeat/"}, kPosixFiles},
    {"lasd/",
     {"platform/", kHost, "lasd/"},
     {"fcntl.h", "sys/stat.h", "sys/types.h", "unistd.h", "zlib.h"}},
    {"main/", {"platform/", kHost, "handlers/", "location/", "heartbeat/", "lasd/"}, {}},
    {"client/",
     {"client/",
      "Helper/Shared/Server/MessageLayouts.h",
      "platform/MachMessage.h",
      "platform/MachPort.h"},
     {"*"}},
    {"tools/",
     {"tools/",
      "client/",
      "Helper/Shared/Server/MessageLayouts.h",
      "platform/MachMessage.h",
      "platform/MachPort.h",
      "platform/PropertyList.h",
      "platform/PropertyListLimits.h",
      "platform/PropertyListText.h",
      "platform/BuildConstants.h",
      "platform/linux/OwnedFd.h",
      "platform/linux/ServiceSocket.h"},
     {"*"}},
};

const Rule* RuleFor(const std::string& file) {
    const Rule* best = nullptr;
    for (const Rule& rule : kRules) {
        if (file.starts_with(rule.folder) &&
            (best == nullptr ||
             std::string(rule.folder).size() > std::string(best->folder).size())) {
            best = &rule;
        }
    }
    return best;
}

bool IsAllowed(const Rule& rule, const std::string& included, bool isOurs) {
    if (isOurs) {
        return std::ranges::any_of(rule.ours, [&](const auto& prefix) {
            // Twins are chosen by linking: outside them nobody knows of them, but for a rule that
            // names a header of theirs.
            const bool isTwin =
                included.starts_with("platform/linux/") || included.starts_with("platform/sim/");
            return included.starts_with(prefix) &&
                   (!isTwin || included.starts_with(rule.folder) || included == prefix);
        });
    }
    const bool isCxxLibrary = included.find('.') == std::string::npos;
    return isCxxLibrary || std::ranges::any_of(rule.systems, [&](const auto& name) {
               return name == "*" || name == included;
           });
}

/// The forbidden includes of one file, as lines of a message.
std::string Violations(const std::string& file, const std::string& text) {
    static const std::regex kInclude(R"(^\s*#\s*include\s*([<"])([^>"]+)[>"])",
                                     std::regex::multiline);
    const Rule* const rule = RuleFor(file);
    std::string violations;
    for (auto at = std::sregex_iterator(text.begin(), text.end(), kInclude);
         at != std::sregex_iterator();
         ++at) {
        if (rule != nullptr && !IsAllowed(*rule, (*at)[2], (*at)[1] == "\"")) {
            violations += file + " may not include " + (*at)[2].str() + "\n";
        }
    }
    return violations;
}

/// Tests and what they share may use either twin.
bool IsTest(const std::string& file) {
    return file.find("_test.") != std::string::npos || file.ends_with("Test.h");
}

TEST(IncludeRules, HoldForEverySource) {
    std::size_t files = 0;
    for (const auto& file : tree::Files({".h", ".cpp", ".in"})) {
        if (!IsTest(file)) {
            EXPECT_EQ(Violations(file, tree::Read(file)), "");
            ++files;
        }
    }
    EXPECT_GT(files, 50U) << "the tree was read";
}

TEST(IncludeRules, CatchWhatPointsUpOrAside) {
    EXPECT_NE(Violations("platform/X.h", "#include \"Helper/Shared/Server/X.h\"\n"), "");
    EXPECT_NE(Violations("handlers/carrier/X.cpp", "#include \"platform/linux/OwnedFd.h\"\n"), "");
    EXPECT_NE(Violations("handlers/voicemail/X.cpp", "#include \"handlers/files/X.h\"\n"), "");
    EXPECT_NE(Violations("lasd/X.cpp", "#include <sys/epoll.h>\n"), "");
    EXPECT_NE(Violations("platform/sim/X.cpp", "#include \"platform/linux/OwnedFd.h\"\n"), "");
    EXPECT_EQ(Violations("lasd/X.cpp", "#include <zlib.h>\n#include <vector>\n"), "");
}

}  // namespace
