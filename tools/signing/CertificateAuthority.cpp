#include "signing/CertificateAuthority.h"

#include <openssl/ec.h>
#include <openssl/rand.h>
#include <openssl/x509v3.h>

#include <cstdint>

namespace tallyd::signing {

namespace {

constexpr long kOneHour = 60L * 60;
constexpr long kOneDay = 24 * kOneHour;
constexpr long kValidity = 3650 * kOneDay;
constexpr long kX509Version3 = 2;

OpenSSLPointer<EVP_PKEY> makeKey() {
  OpenSSLPointer<EVP_PKEY> key(EVP_EC_gen("P-256"));
  requireOpenSSL(key != nullptr, "making an EC key");
  return key;
}

void setRandomSerial(X509* certificate) {
  std::uint64_t serial = 0;
  requireOpenSSL(RAND_bytes(reinterpret_cast<unsigned char*>(&serial), sizeof serial) == 1,
                 "drawing a number");
  requireOpenSSL(ASN1_INTEGER_set_uint64(X509_get_serialNumber(certificate), serial) == 1,
                 "numbering a certificate");
}

void addExtension(X509* certificate, X509* issuer, int kind, const std::string& value) {
  X509V3_CTX context;
  X509V3_set_ctx_nodb(&context);
  X509V3_set_ctx(&context, issuer, certificate, nullptr, nullptr, 0);
  X509_EXTENSION* extension = X509V3_EXT_conf_nid(nullptr, &context, kind, value.c_str());
  requireOpenSSL(extension != nullptr, "making a certificate extension");
  const int added = X509_add_ext(certificate, extension, -1);
  X509_EXTENSION_free(extension);
  requireOpenSSL(added == 1, "adding a certificate extension");
}

/// A certificate that lacks only its extensions, its issuer and the signature.
OpenSSLPointer<X509> makeCertificate(EVP_PKEY* key, const std::string& commonName) {
  OpenSSLPointer<X509> certificate(X509_new());
  requireOpenSSL(certificate != nullptr, "making a certificate");
  X509* const raw = certificate.get();
  setRandomSerial(raw);
  // A day early, for clocks that differ.
  const bool filled =
      X509_set_version(raw, kX509Version3) == 1 &&
      X509_gmtime_adj(X509_getm_notBefore(raw), -kOneDay) != nullptr &&
      X509_gmtime_adj(X509_getm_notAfter(raw), kValidity) != nullptr && X509_set_pubkey(raw, key) == 1 &&
      X509_NAME_add_entry_by_txt(X509_get_subject_name(raw), "CN", MBSTRING_UTF8,
                                 reinterpret_cast<const unsigned char*>(commonName.c_str()), -1, -1, 0) == 1;
  requireOpenSSL(filled, "filling a certificate");
  return certificate;
}

void sign(X509* certificate, X509* issuer, EVP_PKEY* issuerKey) {
  requireOpenSSL(X509_set_issuer_name(certificate, X509_get_subject_name(issuer)) == 1, "naming the issuer");
  addExtension(certificate, issuer, NID_subject_key_identifier, "hash");
  addExtension(certificate, issuer, NID_authority_key_identifier, "keyid");
  requireOpenSSL(X509_sign(certificate, issuerKey, EVP_sha256()) > 0, "signing a certificate");
}

}  // namespace

CertificateAuthority::CertificateAuthority(const std::string& commonName)
    : _key(makeKey()), _certificate(makeCertificate(_key.get(), commonName)) {
  addExtension(_certificate.get(), _certificate.get(), NID_basic_constraints, "critical,CA:TRUE,pathlen:0");
  addExtension(_certificate.get(), _certificate.get(), NID_key_usage, "critical,keyCertSign,cRLSign");
  sign(_certificate.get(), _certificate.get(), _key.get());
  _certificatePEM = signing::certificatePEM(_certificate.get());
}

TLSIdentity CertificateAuthority::issue(const std::vector<std::string>& subjectAltNames,
                                        Validity validity) const {
  std::string names;
  for (const std::string& name : subjectAltNames) names += (names.empty() ? "" : ",") + name;

  const auto key = makeKey();
  const auto certificate =
      makeCertificate(key.get(), subjectAltNames.front().substr(subjectAltNames.front().find(':') + 1));
  if (validity == Validity::Expired) {
    requireOpenSSL(X509_gmtime_adj(X509_getm_notAfter(certificate.get()), -kOneHour) != nullptr,
                   "dating a certificate");
  }
  addExtension(certificate.get(), _certificate.get(), NID_basic_constraints, "critical,CA:FALSE");
  addExtension(certificate.get(), _certificate.get(), NID_key_usage, "critical,digitalSignature");
  addExtension(certificate.get(), _certificate.get(), NID_ext_key_usage, "serverAuth");
  addExtension(certificate.get(), _certificate.get(), NID_subject_alt_name, names);
  sign(certificate.get(), _certificate.get(), _key.get());
  return {signing::certificatePEM(certificate.get()), privateKeyPEM(key.get())};
}

}  // namespace tallyd::signing
