#include "tools/shared/Certificate.h"

#include <arpa/inet.h>
#include <memory>

#include <fmt/format.h>
#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rand.h>
#include <openssl/x509v3.h>

#include "platform/files/Files.h"

namespace tavrin::tools {
namespace {

constexpr std::chrono::hours kRenewBefore{24};

template <auto release> struct Deleter {
    template <class T> void operator()(T* pointer) const { release(pointer); }
};
using KeyPtr = std::unique_ptr<EVP_PKEY, Deleter<EVP_PKEY_free>>;
using CertificatePtr = std::unique_ptr<X509, Deleter<X509_free>>;
using BioPtr = std::unique_ptr<BIO, Deleter<BIO_free_all>>;
using ExtensionPtr = std::unique_ptr<X509_EXTENSION, Deleter<X509_EXTENSION_free>>;

bool isAddress(const std::string& text)
{
    in6_addr parsed;
    return inet_pton(AF_INET, text.c_str(), &parsed) == 1 || inet_pton(AF_INET6, text.c_str(), &parsed) == 1;
}

std::time_t seconds(platform::Date date)
{
    return std::chrono::system_clock::to_time_t(
        std::chrono::time_point_cast<std::chrono::system_clock::duration>(date));
}

BioPtr readable(std::string_view text)
{
    return BioPtr(BIO_new_mem_buf(text.data(), static_cast<int>(text.size())));
}

std::string contents(BIO* bio)
{
    char* data = nullptr;
    const long size = BIO_get_mem_data(bio, &data);
    return {data, static_cast<std::size_t>(size)};
}

bool covers(X509* certificate, const std::string& name)
{
    if (isAddress(name)) return X509_check_ip_asc(certificate, name.c_str(), 0) == 1;
    return X509_check_host(certificate, name.data(), name.size(), 0, nullptr) == 1;
}

bool isUsable(const CertificateFiles& files, platform::FileSystem& fileSystem, const std::string& address,
              platform::Date now)
{
    constexpr std::size_t kMaximumSize = 64 * 1024;
    const auto certificateText = fileSystem.read(files.certificate, kMaximumSize);
    const auto keyText = fileSystem.read(files.key, kMaximumSize);
    if (!certificateText || !keyText) return false;
    const CertificatePtr certificate(
        PEM_read_bio_X509(readable(certificateText->view()).get(), nullptr, nullptr, nullptr));
    const KeyPtr key(PEM_read_bio_PrivateKey(readable(keyText->view()).get(), nullptr, nullptr, nullptr));
    ERR_clear_error();
    if (!certificate || !key || X509_check_private_key(certificate.get(), key.get()) != 1) return false;
    std::time_t start = seconds(now);
    std::time_t end = seconds(now + kRenewBefore);
    if (X509_cmp_time(X509_get0_notBefore(certificate.get()), &start) > 0) return false;
    if (X509_cmp_time(X509_get0_notAfter(certificate.get()), &end) < 0) return false;
    for (const std::string& name : {std::string("localhost"), std::string("127.0.0.1"), std::string("::1"), address})
        if (!covers(certificate.get(), name)) return false;
    return true;
}

bool addExtension(X509* certificate, int identifier, const std::string& value)
{
    X509V3_CTX context;
    X509V3_set_ctx(&context, certificate, certificate, nullptr, nullptr, 0);
    const ExtensionPtr extension(X509V3_EXT_conf_nid(nullptr, &context, identifier, value.c_str()));
    return extension && X509_add_ext(certificate, extension.get(), -1) == 1;
}

CertificatePtr makeCertificate(EVP_PKEY* key, const std::string& address, platform::Date now,
                               std::chrono::hours lifetime)
{
    CertificatePtr certificate(X509_new());
    X509_set_version(certificate.get(), X509_VERSION_3);
    std::uint64_t serial = 0;
    RAND_bytes(reinterpret_cast<unsigned char*>(&serial), sizeof serial);
    ASN1_INTEGER_set_uint64(X509_get_serialNumber(certificate.get()), serial >> 1);
    // One hour in the past for clients whose clock is slow.
    ASN1_TIME_set(X509_getm_notBefore(certificate.get()), seconds(now - std::chrono::hours(1)));
    ASN1_TIME_set(X509_getm_notAfter(certificate.get()), seconds(now + lifetime));
    X509_NAME* name = X509_get_subject_name(certificate.get());
    X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_UTF8, reinterpret_cast<const unsigned char*>("tavrin-devserver"),
                               -1, -1, 0);
    X509_set_issuer_name(certificate.get(), name);
    X509_set_pubkey(certificate.get(), key);

    std::string names = "DNS:localhost,IP:127.0.0.1,IP:::1";
    if (!address.empty() && address != "localhost" && address != "127.0.0.1" && address != "::1")
        names += (isAddress(address) ? ",IP:" : ",DNS:") + address;
    const bool complete = addExtension(certificate.get(), NID_basic_constraints, "critical,CA:TRUE,pathlen:0") &&
                          addExtension(certificate.get(), NID_key_usage, "critical,digitalSignature,keyCertSign") &&
                          addExtension(certificate.get(), NID_ext_key_usage, "serverAuth") &&
                          addExtension(certificate.get(), NID_subject_key_identifier, "hash") &&
                          addExtension(certificate.get(), NID_subject_alt_name, names);
    if (!complete || X509_sign(certificate.get(), key, EVP_sha256()) == 0) return nullptr;
    return certificate;
}

} // namespace

std::expected<CertificateFiles, std::string> provideCertificate(const std::filesystem::path& directory,
                                                                const std::string& address, platform::Date now,
                                                                std::chrono::hours lifetime)
{
    const auto fileSystem = platform::makeSystemFiles();
    CertificateFiles files{directory / "cert.pem", directory / "key.pem", false};
    if (const auto made = fileSystem->createDirectories(directory); !made)
        return std::unexpected(fmt::format("can't create {}: {}; choose another directory with --cert-dir",
                                           directory.string(), made.error().reason()));
    if (isUsable(files, *fileSystem, address, now)) return files;

    const KeyPtr key(EVP_EC_gen("P-256"));
    const CertificatePtr certificate = key ? makeCertificate(key.get(), address, now, lifetime) : nullptr;
    const BioPtr certificateText(BIO_new(BIO_s_mem()));
    const BioPtr keyText(BIO_new(BIO_s_mem()));
    if (!certificate || !PEM_write_bio_X509(certificateText.get(), certificate.get()) ||
        !PEM_write_bio_PrivateKey(keyText.get(), key.get(), nullptr, nullptr, 0, nullptr, nullptr))
        return std::unexpected(fmt::format("can't make a certificate for \"{}\"", address));
    // Key first: if writing is interrupted, the pair does not match and is made again.
    for (const auto& [path, bio] :
         {std::pair(files.key, keyText.get()), std::pair(files.certificate, certificateText.get())})
        if (const auto written = fileSystem->writeAtomically(path, contents(bio)); !written)
            return std::unexpected(fmt::format("can't write {}: {}", path.string(), written.error().reason()));
    files.made = true;
    return files;
}

} // namespace tavrin::tools
