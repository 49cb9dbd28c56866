// A certificate authority that the phone's private bundle names for as long as it is there.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace simulator {

/// What is wrong with a server's certificate.
enum class Flaw : unsigned char { kNone, kExpired, kOtherHost, kSelfSigned, kUnknownAuthority };

class CertificateAuthority {
public:
    /// Makes keys and certificates for a host in a folder, and adds the authority to the bundle,
    /// unless the flaw is that nobody knows who signed. None when that fails; what to mend was
    /// said.
    [[nodiscard]] static std::optional<CertificateAuthority> create(std::string folder,
                                                                    std::string_view host,
                                                                    Flaw flaw);
    CertificateAuthority(CertificateAuthority&& other) noexcept;
    CertificateAuthority& operator=(CertificateAuthority&&) = delete;
    CertificateAuthority(const CertificateAuthority&) = delete;
    CertificateAuthority& operator=(const CertificateAuthority&) = delete;

    /// Takes the authority out of the bundle again.
    ~CertificateAuthority();

    /// The server's files.
    [[nodiscard]] std::string certificate() const { return folder_ + "/server.crt"; }

    [[nodiscard]] std::string key() const { return folder_ + "/server.key"; }

private:
    explicit CertificateAuthority(std::string folder) : folder_(std::move(folder)) {}

    [[nodiscard]] bool makeCertificates(const std::string& host, Flaw flaw) const;
    [[nodiscard]] bool enterBundle();

    std::string folder_;
    std::string entry_;  // what the bundle holds of ours
};

}  // namespace simulator
