#include "tools/linefold-sim/CertificateAuthority.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <utility>
#include <vector>

#include "tools/linefold-sim/ChildProcess.h"

namespace simulator {
namespace {

constexpr const char* kBundle = "/etc/ssl/certs/ca-certificates.crt";

std::string Read(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// Programs that read the bundle meanwhile see the old one or the new one.
bool WriteBundle(const std::string& contents) {
    const std::string temporary = std::string(kBundle) + ".new";
    std::ofstream file(temporary, std::ios::binary | std::ios::trunc);
    file << contents;
    file.close();
    std::error_code error;
    if (!file.fail()) {
        std::filesystem::rename(temporary, kBundle, error);
    }
    return !file.fail() && !error;
}

using Command = std::vector<std::string>;

Command With(Command command, const Command& more) {
    command.insert(command.end(), more.begin(), more.end());
    return command;
}

/// A new key, and a request or (with -x509) a certificate for it.
Command Request(const std::string& key, const std::string& file, const std::string& name) {
    return {"openssl",
            "req",
            "-newkey",
            "ec",
            "-pkeyopt",
            "ec_paramgen_curve:P-256",
            "-nodes",
            "-keyout",
            key,
            "-out",
            file,
            "-subj",
            "/CN=" + name};
}

}  // namespace

std::optional<CertificateAuthority> CertificateAuthority::create(std::string folder,
                                                                 std::string_view host,
                                                                 Flaw flaw) {
    CertificateAuthority authority(std::move(folder));
    if (!authority.makeCertificates(std::string(host), flaw)) {
        (void)std::fputs("linefold-sim: openssl cannot make the certificates\n", stderr);
        return std::nullopt;
    }
    const bool isKnown = flaw != Flaw::kUnknownAuthority && flaw != Flaw::kSelfSigned;
    if (isKnown && !authority.enterBundle()) {
        (void)std::fprintf(stderr, "linefold-sim: cannot add to %s\n", kBundle);
        return std::nullopt;
    }
    return authority;
}

CertificateAuthority::CertificateAuthority(CertificateAuthority&& other) noexcept
    : folder_(std::move(other.folder_)), entry_(std::exchange(other.entry_, {})) {}

CertificateAuthority::~CertificateAuthority() {
    std::string bundle = entry_.empty() ? std::string() : Read(kBundle);
    if (const auto at = bundle.find(entry_); !entry_.empty() && at != std::string::npos) {
        (void)WriteBundle(bundle.erase(at, entry_.size()));
    }
}

bool CertificateAuthority::makeCertificates(const std::string& host, Flaw flaw) const {
    const std::string name = flaw == Flaw::kOtherHost ? "other." + host : host;
    const Command alternatives{"-addext", "subjectAltName=DNS:" + name};
    if (flaw == Flaw::kSelfSigned) {
        return Run(With(With(Request(key(), certificate(), name), alternatives),
                        {"-x509", "-days", "2", "-addext", "basicConstraints=critical,CA:FALSE"}));
    }
    const std::string authority = folder_ + "/authority.crt";
    const std::string authorityKey = folder_ + "/authority.key";
    const std::string request = folder_ + "/server.csr";
    return Run(With(Request(authorityKey, authority, "Authority of the phone's simulator"),
                    {"-x509", "-days", "2", "-addext", "keyUsage=critical,keyCertSign"})) &&
           Run(With(Request(key(), request, name), alternatives)) &&
           Run({"openssl",
                "x509",
                "-req",
                "-in",
                request,
                "-CA",
                authority,
                "-CAkey",
                authorityKey,
                "-CAcreateserial",
                "-copy_extensions",
                "copy",
                "-out",
                certificate(),
                "-days",
                flaw == Flaw::kExpired ? "-1" : "2"});
}

bool CertificateAuthority::enterBundle() {
    const std::string certificate = Read(folder_ + "/authority.crt");
    const std::string bundle = Read(kBundle);
    if (certificate.empty() || !WriteBundle(bundle + certificate)) {
        return false;
    }
    entry_ = certificate;
    return true;
}

}  // namespace simulator
