// The server, the phone and the telephony daemon around the updater, for tests.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/PropertyList.h"
#include "platform/hvu/Gzip_test.h"
#include "platform/sim/Sim.h"
#include "platform/sim/SimFiles.h"
#include "platform/sim/SimHttp.h"
#include "platform/sim/SimMessagePort.h"

namespace updater_test {

using platform::PropertyList;
using Dictionary = PropertyList::Dictionary;

inline const std::string kIndexUrl = "https://configuration.vendra.example/1/v3/lasd.plist";
inline const std::string kServer = "https://configuration.vendra.example/databases/";
inline const std::string kFolder = "/var/mobile/Library/LASD";
inline constexpr const char* kDomain = "com.vendra.lasd";
inline constexpr const char* kPort = "com.vendra.Linefold.lasd";

inline sim::LogLine Info(std::string text) {
    return {.level = platform::LogLevel::kInfo, .text = std::move(text)};
}

inline sim::LogLine Error(std::string text) {
    return {.level = platform::LogLevel::kError, .text = std::move(text)};
}

inline std::string Text(const std::vector<std::byte>& bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

inline PropertyList Entry(const std::string& version, const std::string& url) {
    return PropertyList(
        Dictionary{{"Version", PropertyList(version)}, {"ContentURL", PropertyList(url)}});
}

/// What the server has at this URL. No index is served with other contents than these.
inline std::string ServeIndex(Dictionary entries) {
    auto body = Text(PropertyListCreateXmlData(PropertyList(std::move(entries))).value());
    sim::ServeUrl(kIndexUrl, {.body = body});
    return body;
}

inline void ServeDatabase(const std::string& url, std::string_view contents) {
    sim::ServeUrl(url,
                  {.headers = {{"Content-Type", "application/x-gzip"}}, .body = Gzip(contents)});
}

/// An entry of this version, whose file holds "<type> <version>".
inline std::pair<std::string, PropertyList> Offer(const std::string& type,
                                                  const std::string& version) {
    const std::string url = kServer + type + ".db.gz";
    ServeDatabase(url, type + " " + version);
    return {type, Entry(version, url)};
}

/// The installed record.
inline void Record(Dictionary entries) {
    sim::StorePreferences(kDomain, PropertyList(std::move(entries)));
}

inline PropertyList Recorded() {
    return sim::StoredPreferences(kDomain);
}

inline std::string FileContents(const std::string& path) {
    const auto file = sim::FileAt(path);
    return file ? file->contents : "(no file)";
}

/// What the telephony daemon heard: each notification by the last word of its name, and its type.
inline std::vector<std::string> Heard() {
    std::vector<std::string> heard;
    for (const auto& message : sim::TakePortMessages(kPort)) {
        const auto list = platform::PropertyListCreateWithData(message.data);
        const auto* const name = list ? list->find("Notification") : nullptr;
        if (message.id != 0 || name == nullptr || name->as<std::string>() == nullptr) {
            heard.emplace_back("(something else)");
            continue;
        }
        std::string text = *name->as<std::string>();
        text.erase(0, text.rfind('.') + 1);
        if (const auto* const type = list->find("DBType")) {
            text += " " + *type->as<std::string>();
        }
        heard.push_back(text);
    }
    return heard;
}

using Words = std::vector<std::string>;

}  // namespace updater_test
