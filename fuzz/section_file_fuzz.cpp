// Any text, changed by the section-file services and by the plain model: both results must be
// equal, and every option that was written must be read back.
//
// Input: a line with the name of a section, a line with pairs "key=value" separated by tabs, and
// the text.

#include "base/section_grammar.h"
#include "base/section_reader.h"
#include "fuzz/memory_file.h"
#include "fuzz/support.h"
#include "platform/core/section_text.h"
#include "tests/platform/core_section_model.h"

#include <memory>
#include <optional>
#include <vector>

namespace Grammar = KOVA::Base::SectionGrammar;
namespace Model = KovaTest::Model;
using namespace KovaPlatform;
using KovaFuzz::require;

namespace {

const KovaFuzz::MemoryFile file;

// What a C string would pass on of the text up to a separator.
std::string take(KovaFuzz::Input &input, char separator) {
  return input.until(separator).c_str();
}

struct FreeHash {
  void operator()(KLIBCSzHash *hash) const { KLIBCSzHashFree(hash); }
};
using Hash = std::unique_ptr<KLIBCSzHash, FreeHash>;

Hash readPairs(const std::string &line) {
  KLIBCSzHash *hash = KLIBCSzHashAlloc(0);
  KovaFuzz::Input pairs(reinterpret_cast<const std::uint8_t *>(line.data()), line.size());
  while (!pairs.empty()) {
    std::string pair = take(pairs, '\t');
    const std::string key = pair.substr(0, pair.find('='));
    pair.erase(0, key.size() + 1);
    require((KLIBCSzHashSetValue(&hash, key.c_str(), pair.c_str()) >= 0) ==
            (Grammar::isStorableKey(key) && Grammar::isStorableValue(pair)));
  }
  return Hash(hash);
}

// Read in blocks of a few bytes, so that lines are cut at every byte.
std::vector<std::string> namesOf(const std::string &text) {
  file.write(text);
  KOVA::Base::SectionReader reader(file.fd(), 1 + text.size() % 7);
  std::vector<std::string> names;
  require(reader && readNames(reader, names));
  return names;
}

void checkReadBack(const std::string &text, const std::string &name, const Model::Pairs &pairs) {
  std::map<std::string, std::string> expected;
  for (const auto &[key, value] : pairs) {
    expected[key] = Model::trimmed(value);
  }
  require(Model::load(text, name) == expected);
}

void checkChanges(const std::string &text, const std::string &name, const KLIBCSzHash &hash) {
  Model::Pairs pairs;
  for (const KLIBCSzHash::Pair &pair : hash.pairs) {
    pairs.emplace_back(pair.key, pair.value);
  }
  const SectionParts parts = findSection(text, name);
  const std::string before(parts.before);
  std::optional<std::string> set;
  std::optional<std::string> added;
  std::optional<std::string> removed;
  if (parts.found) {
    removed = before + std::string(parts.after);
  }
  if (parts.found && !parts.hidden) {
    set = before + rewriteSection(text, parts, hash) + std::string(parts.after);
    checkReadBack(*set, name, pairs);
  }
  if (!parts.found && !parts.hidden) {
    added = text + newSection(text, name, hash);
    checkReadBack(*added, name, pairs);
  }
  require(set == Model::set(text, name, pairs));
  require(added == Model::add(text, name, pairs));
  require(removed == Model::remove(text, name));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  const std::string name = take(input, '\n');
  const Hash hash = readPairs(take(input, '\n'));
  const std::string text = input.rest();
  require(namesOf(text) == Model::names(text));
  if (Grammar::isStorableSectionName(name)) {
    checkChanges(text, name, *hash);
  }
  return 0;
}
