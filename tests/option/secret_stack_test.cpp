// What secrets leave on the stack of the thread that sets or gets them: no word of the clear text.

#include "kovabackup/option_map.h"
#include "tests/support/files.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <gtest/gtest.h>
#include <pthread.h>
#include <string>
#include <vector>

using namespace KOVA::Backup;
using namespace KovaTest;

namespace {

constexpr std::size_t kWordBytes = 8;

struct Secret {
  OptionMap map;
  std::string text = "open sesame, and close behind me before the thieves are back again";
  std::string string;
  std::vector<char> buffer = std::vector<char>(100);
};

// Runs a thread on a stack of its own. Returns: what is on the stack afterwards.
std::vector<char> stackAfter(void *(*run)(void *), Secret &secret) {
  std::vector<char> stack(std::size_t{1} << 18);
  pthread_attr_t attributes;
  pthread_t thread = 0;
  EXPECT_EQ(0, ::pthread_attr_init(&attributes));
  EXPECT_EQ(0, ::pthread_attr_setstack(&attributes, stack.data(), stack.size()));
  EXPECT_EQ(0, ::pthread_create(&thread, &attributes, run, &secret));
  EXPECT_EQ(0, ::pthread_join(thread, nullptr));
  EXPECT_EQ(0, ::pthread_attr_destroy(&attributes));
  return stack;
}

std::size_t countWords(const std::vector<char> &stack, const std::string &text) {
  std::size_t found = 0;
  for (std::size_t at = 0; at + kWordBytes <= text.size(); ++at) {
    const void *const hit = ::memmem(stack.data(), stack.size(), text.data() + at, kWordBytes);
    found += hit != nullptr ? 1U : 0U;
  }
  return found;
}

class SecretStack : public testing::Test {
protected:
  SecretStack() {
    writeFile(dir_ / "platform.conf", "[secret]\nkeyFile=\"" + dir_ / "key" + "\"\n");
    ::setenv("KOVA_PLATFORM_CONF", (dir_ / "platform.conf").c_str(), 1);
  }
  ~SecretStack() override { ::unsetenv("KOVA_PLATFORM_CONF"); }

  void expectClean(void *(*run)(void *)) {
    EXPECT_EQ(0U, countWords(stackAfter(run, secret_), secret_.text)) << "words";
  }

  TestFolder dir_;
  Secret secret_;
};

// Deeper than the end of the thread reaches.
void *leaveWords(void *arg) {
  const std::string &text = static_cast<Secret *>(arg)->text;
  volatile char deep[32768];
  std::copy(text.begin(), text.end(), deep);
  return nullptr;
}

void *setSecret(void *arg) {
  auto &secret = *static_cast<Secret *>(arg);
  secret.map.optSet("key", secret.text, true);
  return nullptr;
}

void *getString(void *arg) {
  auto &secret = *static_cast<Secret *>(arg);
  secret.map.optGet("key", secret.string, true);
  return nullptr;
}

void *getBuffer(void *arg) {
  auto &secret = *static_cast<Secret *>(arg);
  secret.map.optGet("key", secret.buffer.data(), static_cast<unsigned>(secret.buffer.size()), true);
  return nullptr;
}

void *getWithDefault(void *arg) {
  auto &secret = *static_cast<Secret *>(arg);
  secret.string = secret.map.optSecret("key", "");
  return nullptr;
}

} // namespace

TEST_F(SecretStack, IsSearchedCorrectly) {
  EXPECT_LT(0U, countWords(stackAfter(&leaveWords, secret_), secret_.text));
}

TEST_F(SecretStack, HoldsNoWordOfASecretThatWasSet) {
  expectClean(&setSecret);
}

// A short text is inside the string object, which may be on the stack.
TEST_F(SecretStack, HoldsNoWordOfAShortSecret) {
  secret_.text = "open sesame";
  expectClean(&setSecret);
  for (const auto run : {&getString, &getBuffer}) {
    expectClean(run);
  }
  EXPECT_EQ(secret_.text, secret_.string);
}

TEST_F(SecretStack, HoldsNoWordOfASecretThatWasRead) {
  for (const auto run : {&getString, &getBuffer, &getWithDefault}) {
    secret_.map.optSet("key", secret_.text, true);
    expectClean(run);
  }
  EXPECT_EQ(secret_.text, secret_.string);
  EXPECT_EQ(secret_.text, secret_.buffer.data());
}
