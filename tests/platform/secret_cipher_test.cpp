// What remains of a text that turned out to be forged.

#include "platform/core/secret_cipher.h"

#include "platform/core/secret_key.h"

#include <gtest/gtest.h>
#include <string>

namespace {

using namespace KovaPlatform;

std::string bytesOf(const SecureBuffer &buffer) {
  return {reinterpret_cast<const char *>(buffer.data()), buffer.size()};
}

// A caller that ignores the result must not find a text that no one encrypted.
TEST(SecretCipher, LeavesNothingOfAForgedText) {
  ASSERT_LE(0, ::sodium_init());
  const SecureBuffer master(kMasterKeyBytes);
  const std::string text = "open sesame";
  std::string cipherText = encryptText(master, text);
  SecureBuffer decrypted(text.size());
  ASSERT_TRUE(decryptText(master, cipherText, decrypted));
  ASSERT_EQ(text, bytesOf(decrypted));

  cipherText.front() = cipherText.front() == 'A' ? 'B' : 'A';
  EXPECT_FALSE(decryptText(master, cipherText, decrypted));
  EXPECT_EQ(std::string(text.size(), '\0'), bytesOf(decrypted));
}

} // namespace
