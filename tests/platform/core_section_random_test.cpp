// Random section files full of near misses, changed by the services and by a plain model.

#include "tests/platform/core_section_model.h"
#include "tests/platform/core_support.h"

#include <array>
#include <gmock/gmock.h>
#include <random>

using namespace KovaTest;

namespace {

constexpr unsigned kSeed = 20240612;
constexpr int kRounds = 6000;

const std::vector<std::string> kNames = {"s",  "t",   "s]",    "[s",    "sx",
                                         "#s", "s=1", "task1", "task12"};

class Hostile {
public:
  explicit Hostile(unsigned seed) : random_(seed) {}

  unsigned below(unsigned limit) { return static_cast<unsigned>(random_() % limit); }

  const std::string &name() {
    return kNames[below(2) == 0 ? 0 : below(static_cast<unsigned>(kNames.size()))];
  }

  std::string text() {
    std::string made;
    for (unsigned line = below(24); line > 0; --line) {
      made += piece(kWhiteSpace) + body() + piece(kWhiteSpace) + piece(kEnds);
    }
    return made;
  }

  Pairs pairs() {
    Pairs made;
    for (unsigned count = below(5); count > 0; --count) {
      const std::string key = piece(kKeys);
      const bool known = std::any_of(made.begin(), made.end(),
                                     [&](const auto &pair) { return pair.first == key; });
      if (!known) {
        made.emplace_back(key, piece(kValues));
      }
    }
    return made;
  }

private:
  using Pieces = std::vector<std::string>;

  std::string piece(const Pieces &pieces) {
    return pieces[below(static_cast<unsigned>(pieces.size()))];
  }

  std::string body() {
    switch (below(10)) {
    case 0:
      return "[" + piece({"s", "t", name()}) + "]";
    case 1:
      return below(4) != 0 ? "" : "[" + name() + piece({"x", "", "] x", "]]"});
    case 2:
    case 3:
      return "#" + piece(kKeys) + piece({"=", "", " [s]"});
    case 4:
      return piece(kOdd);
    default:
      return piece(kKeys) + piece(kWhiteSpace) + "=" + piece(kWhiteSpace) + piece(kValues);
    }
  }

  const Pieces kWhiteSpace = {"", "", "", " ", "\t", "\r", " \t\r "};
  const Pieces kEnds = {"\n", "\n", "\n", "\n", "\n", "\r\n", "\r\n", ""};
  const Pieces kKeys = {"a", "b", "c", "a b", "]", "\va", "d#", "\xff"};
  const Pieces kValues = {"1", "\"x\"", "", "[\"a\",\"b\"]", "\"=\"", "#", "[s]", "a=b"};
  const Pieces kOdd = {"",      "",
                       "=",     "==1",
                       "#",     "[",
                       "]",     "[]",
                       "a",     "a=",
                       "=1",    "\v",
                       "\f[s]", std::string("\0", 1),
                       " #a=1", "#=",
                       "a[s]",  std::string("a\0=1", 4),
                       "[\0]"};
  std::mt19937 random_;
};

// The text after a change by the services; none when it was refused.
std::optional<std::string> changed(const std::string &path, const std::string &text, bool done) {
  const std::string after = readFile(path);
  if (!done) {
    EXPECT_EQ(text, after) << "a refused change has left something";
    return std::nullopt;
  }
  return after;
}

std::map<std::string, std::string> optionsOf(const Pairs &pairs) {
  return {pairs.begin(), pairs.end()};
}

// What a reader finds in all other sections after a change of one.
void expectOthersSame(const std::string &before, const std::string &after,
                      const std::string &name) {
  for (const std::string &other : kNames) {
    if (other != name) {
      EXPECT_EQ(Model::load(before, other), Model::load(after, other)) << other;
    }
  }
}

} // namespace

TEST(SectionRandom, AgreesWithThePlainModel) {
  std::printf("seed %u\n", kSeed);
  Hostile hostile(kSeed);
  const TestFolder dir;
  const std::string path = dir / "conf";
  std::array<int, 3> made{};
  for (int round = 0; round < kRounds && !HasFailure(); ++round) {
    const std::string text = hostile.text();
    const std::string &name = hostile.name();
    const Pairs pairs = hostile.pairs();
    SCOPED_TRACE(testing::Message() << "round " << round << " section " << name << " of\n" << text);
    writeFile(path, text);
    ASSERT_EQ(Model::names(text), sectionNames(path));

    const auto set = changed(path, text, setSection(path, name, pairs) == 1);
    ASSERT_EQ(Model::set(text, name, pairs), set);
    if (set) {
      ++made[0];
      EXPECT_EQ(optionsOf(pairs), Model::load(*set, name));
      expectOthersSame(text, *set, name);
    }

    writeFile(path, text);
    const auto added = changed(path, text, addSection(path, name, pairs) >= 0);
    ASSERT_EQ(Model::add(text, name, pairs), added);
    if (added) {
      ++made[1];
      EXPECT_EQ(optionsOf(pairs), Model::load(*added, name));
      expectOthersSame(text, *added, name);
    }

    writeFile(path, text);
    const auto removed = changed(path, text, removeSection(path, name) == 1);
    ASSERT_EQ(Model::remove(text, name), removed);
    if (removed) {
      ++made[2];
      expectOthersSame(text, *removed, name);
    }
  }
  std::printf("%d set, %d added, %d removed\n", made[0], made[1], made[2]);
  for (const int count : made) {
    EXPECT_LT(kRounds / 20, count) << "hardly any change was made: the rounds prove little";
  }
}
