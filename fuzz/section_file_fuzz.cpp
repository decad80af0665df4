// Any text, changed by the section-file services and by the plain model: both results must be
// equal, and every option that was written must be read back.
//
// Input: a line with the name of a section, a line with pairs "key=value" separated by tabs, and
// the text.

#include "base/section_grammar.h"
#include "base/section_reader.h"
#include "base/unique_fd.h"
#include "platform/core/section_text.h"
#include "tests/platform/core_section_model.h"

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <sys/mman.h>
#include <unistd.h>
#include <vector>

namespace Grammar = KOVA::Base::SectionGrammar;
namespace Model = KovaTest::Model;
using namespace KovaPlatform;

namespace {

void require(bool holds) {
  if (!holds) {
    std::abort();
  }
}

// Removes the text up to a separator from the input, or all of it if there is no separator.
std::string take(std::string &input, char separator) {
  const std::size_t end = input.find(separator);
  std::string taken = input.substr(0, end);
  input.erase(0, end == std::string::npos ? end : end + 1);
  return taken.substr(0, taken.find('\0')); // what a C string would pass on
}

struct FreeHash {
  void operator()(KLIBCSzHash *hash) const { KLIBCSzHashFree(hash); }
};
using Hash = std::unique_ptr<KLIBCSzHash, FreeHash>;

Hash readPairs(std::string line) {
  KLIBCSzHash *hash = KLIBCSzHashAlloc(0);
  while (!line.empty()) {
    std::string pair = take(line, '\t');
    const std::string key = take(pair, '=');
    require((KLIBCSzHashSetValue(&hash, key.c_str(), pair.c_str()) >= 0) ==
            (Grammar::isStorableKey(key) && Grammar::isStorableValue(pair)));
  }
  return Hash(hash);
}

// Read in blocks of a few bytes, so that lines are cut at every byte.
std::vector<std::string> namesOf(const std::string &text) {
  const KOVA::Base::UniqueFd file(::memfd_create("conf", MFD_CLOEXEC));
  require(::pwrite(file.get(), text.data(), text.size(), 0) == static_cast<ssize_t>(text.size()));
  KOVA::Base::SectionReader reader(file.get(), 1 + text.size() % 7);
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
  std::string text(data, data + size);
  const std::string name = take(text, '\n');
  const Hash hash = readPairs(take(text, '\n'));
  require(namesOf(text) == Model::names(text));
  if (Grammar::isStorableSectionName(name)) {
    checkChanges(text, name, *hash);
  }
  return 0;
}
