#include "tools/crypto/OpenSSLObjects.h"

#include <openssl/err.h>
#include <openssl/pem.h>

#include <stdexcept>

namespace vesk::openssl {

namespace {

using Memory = std::unique_ptr<BIO, Releasing<&BIO_free_all>>;

template <class Write>
std::string written(Write write) {
  Memory memory = checked(Memory(BIO_new(BIO_s_mem())), "allocate memory");
  require(write(memory.get()) == 1, "write PEM");
  char* data = nullptr;
  long size = BIO_get_mem_data(memory.get(), &data);
  return std::string(data, static_cast<std::size_t>(size));
}

Memory reading(const std::string& text) {
  return checked(Memory(BIO_new_mem_buf(text.data(), static_cast<int>(text.size()))), "allocate memory");
}

/// Refuses encrypted keys, for which OpenSSL would otherwise ask for a password.
int noPassword(char*, int, int, void*) { return -1; }

}  // namespace

void fail(const std::string& step) {
  char reason[160] = "unknown cause";
  if (unsigned long code = ERR_peek_last_error(); code != 0) ERR_error_string_n(code, reason, sizeof reason);
  ERR_clear_error();
  throw std::runtime_error("can't " + step + ": " + reason);
}

std::string toPEM(X509* certificate) {
  return written([&](BIO* out) { return PEM_write_bio_X509(out, certificate); });
}

std::string toPEM(EVP_PKEY* privateKey) {
  return written([&](BIO* out) {
    return PEM_write_bio_PrivateKey(out, privateKey, nullptr, nullptr, 0, nullptr, nullptr);
  });
}

Certificate certificateFromPEM(const std::string& text) {
  return Certificate(PEM_read_bio_X509(reading(text).get(), nullptr, &noPassword, nullptr));
}

Key privateKeyFromPEM(const std::string& text) {
  return Key(PEM_read_bio_PrivateKey(reading(text).get(), nullptr, &noPassword, nullptr));
}

}  // namespace vesk::openssl
