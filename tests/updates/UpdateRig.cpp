#include "tests/updates/UpdateRig.h"

#include <filesystem>
#include <fstream>

#include "platform/hvu/Gzip_test.h"

namespace updates {
namespace {

constexpr std::int32_t kCheckForDatabaseUpdate = 8683563;
const std::string kRecordFile =
    std::string(phone::kMobileLibrary) + "/Preferences/com.vendra.lasd.plist";

}  // namespace

void ForgetOtherAuthorities() {
    std::filesystem::resize_file("/etc/ssl/certs/ca-certificates.crt", 0);
}

std::string Xml(const PropertyList& value) {
    const auto data = platform::PropertyListCreateXmlData(value).value();
    return {reinterpret_cast<const char*>(data.data()), data.size()};
}

std::string Contents(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return file ? std::string(std::istreambuf_iterator<char>(file), {}) : "(no file)";
}

PropertyList Entry(const std::string& version, const std::string& url) {
    return PropertyList(
        Dictionary{{"Version", PropertyList(version)}, {"ContentURL", PropertyList(url)}});
}

std::string PutDatabase(const std::string& name, std::string_view contents) {
    web::ConfigurationServer::put("databases/" + name, Gzip(contents));
    return kOrigin + "/databases/" + name;
}

std::size_t PutIndex(Dictionary entries) {
    const std::string index = Xml(PropertyList(std::move(entries)));
    web::ConfigurationServer::put("1/v3/lasd.plist", index);
    return index.size();
}

PropertyList Recorded() {
    const auto list = platform::PropertyListCreateWithData(phone::BytesOf(Contents(kRecordFile)));
    return list.value_or(PropertyList());
}

void Record(Dictionary entries) {
    std::ofstream(kRecordFile) << Xml(PropertyList(std::move(entries)));
    std::filesystem::permissions(kRecordFile, std::filesystem::perms(0644));
}

bool Ask(const phone::Client& client, std::uint32_t mask) {
    auto request = phone::Message(kCheckForDatabaseUpdate, 36);
    platform::Store(std::span<std::byte>(request), 32, mask);
    const auto reply = client.privatePort.call(request);
    return !reply.isEnd() && reply.code() == 0;
}

std::optional<std::string> NameOf(const std::vector<std::byte>& notification) {
    const auto list = platform::PropertyListCreateWithData(notification);
    const auto* const name = list ? list->find("Notification") : nullptr;
    if (name == nullptr || name->as<std::string>() == nullptr) {
        return std::nullopt;
    }
    std::string text = *name->as<std::string>();
    text.erase(0, text.rfind('.') + 1);
    if (const auto* const type = list->find("DBType")) {
        text += " " + *type->as<std::string>();
    }
    return text;
}

}  // namespace updates
