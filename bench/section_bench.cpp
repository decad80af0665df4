// Section files of 20 options a section, raced against GLib's GKeyFile, which parses no values, and
// against the least that any program does: reading the bytes, filling the same list, making the
// same system calls. The wanted section is always the last one, so that the complete file is read.
// Every run checks its result. The file is in the working directory, so run the benchmark on the
// file system of interest.

#include "kovabackup/option_map.h"
#include "kovabackup/service/section_update.h"

#include "bench/race.h"
#include "bench/section_save_calls.h"

#include <cstdio>
#include <fcntl.h>
#include <fstream>
#include <glib.h>
#include <list>
#include <memory>
#include <string>
#include <unistd.h>
#include <vector>

namespace {

using KOVA::Backup::OptionMap;
using KovaBench::Race;
using KovaBench::rounds;
using Names = std::list<std::string>;

constexpr const char *kPath = "section_bench.conf";
constexpr int kOptions = 20;

std::string valueText(int option) {
  switch (option % 10) {
  case 0:
    return "\"the task number " + std::to_string(option) + "\"";
  case 3:
    return "[\"/volume1/photo\",\"/volume1/music\"]";
  case 1:
  case 4:
  case 7:
    return std::to_string(option * 1000);
  case 2:
  case 8:
    return option % 4 == 0 ? "true" : "false";
  default:
    return "\"/volume1/share" + std::to_string(option) + "\"";
  }
}

std::string sectionsText(std::int64_t count) {
  std::string text;
  for (std::int64_t section = 1; section <= count; ++section) {
    text += "[task" + std::to_string(section) + "]\n";
    for (int option = 0; option < kOptions; ++option) {
      text += "option" + std::to_string(option) + "=" + valueText(option) + "\n";
    }
  }
  return text;
}

// The file, with as many sections as the benchmark's argument says.
class File {
public:
  explicit File(std::int64_t sections) : text_(sectionsText(sections)) {
    std::ofstream(kPath) << text_;
  }
  ~File() { (void)std::remove(kPath); }
  File(const File &) = delete;
  File &operator=(const File &) = delete;

  const std::string &text() const { return text_; }

private:
  std::string text_;
};

// The peer that every reader has: the bytes, by blocks of 256 KB.
bool readBytes(std::size_t size) {
  static std::vector<char> block(std::size_t{256} << 10);
  const int fd = ::open(kPath, O_RDONLY | O_CLOEXEC);
  std::size_t all = 0;
  ssize_t got = 0;
  while ((got = ::read(fd, block.data(), block.size())) > 0) {
    all += static_cast<std::size_t>(got);
  }
  (void)::close(fd);
  return all == size;
}

bool readAndList(std::size_t size, const Names &expected) {
  Names names;
  const bool isRead = readBytes(size);
  for (const std::string &name : expected) {
    names.emplace_back(name.c_str());
  }
  return isRead && names.size() == expected.size();
}

struct FreeKeyFile {
  void operator()(GKeyFile *file) const { g_key_file_free(file); }
};
using KeyFile = std::unique_ptr<GKeyFile, FreeKeyFile>;

KeyFile loadKeyFile() {
  KeyFile file(g_key_file_new());
  (void)g_key_file_load_from_file(file.get(), kPath, G_KEY_FILE_NONE, nullptr);
  return file;
}

bool loadByKeyFile(const std::string &name) {
  const KeyFile file = loadKeyFile();
  return g_key_file_has_key(file.get(), name.c_str(), "option19", nullptr) != 0;
}

// What the values alone cost: the share of a load that is not spent on the file.
bool parseValues(const std::vector<std::string> &texts) {
  OptionMap map;
  bool all = true;
  for (const std::string &text : texts) {
    all = map.optLoadJsonString(text) && all;
  }
  return all;
}

void load(benchmark::State &state) {
  const File file(state.range(0));
  const int id = static_cast<int>(state.range(0));
  const std::string name = "task" + std::to_string(id);
  std::vector<std::string> texts;
  for (int option = 0; option < kOptions; ++option) {
    texts.push_back(valueText(option));
  }
  const bool isLong = state.range(0) >= 10000;
  Race(state,
       [&] {
         OptionMap map;
         return map.optSectionLoad(kPath, "task", id) && map.optInt("option17", 0) == 17000;
       })
      .peer(
          "read", [&] { return readBytes(file.text().size()); }, isLong ? 2 : 0)
      .peer(
          "gkeyfile", [&] { return loadByKeyFile(name); }, isLong ? 0.02 : 1)
      .peer("values_alone", [&] { return parseValues(texts); })
      .run();
}
BENCHMARK(load)->Arg(1)->Arg(100)->Arg(1000)->Arg(10000)->Apply(rounds);

Names namesOf(std::int64_t count) {
  Names names;
  for (std::int64_t section = 1; section <= count; ++section) {
    names.push_back("task" + std::to_string(section));
  }
  return names;
}

void listNames(benchmark::State &state) {
  const File file(state.range(0));
  const Names expected = namesOf(state.range(0));
  Race(state,
       [&] {
         Names names;
         return OptionMap::optSectionListName(kPath, names) && names.size() == expected.size();
       })
      .peer(
          "read_and_list", [&] { return readAndList(file.text().size(), expected); }, 1.3)
      .run();
}
BENCHMARK(listNames)->Arg(1)->Arg(100)->Arg(1000)->Arg(10000)->Apply(rounds);

bool appendHeader(const std::string &name) {
  const std::string line = "[" + name + "]\n";
  const int fd = ::open(kPath, O_WRONLY | O_APPEND | O_CLOEXEC);
  const bool isWritten = ::write(fd, line.data(), line.size()) > 0;
  return ::close(fd) == 0 && isWritten;
}

// Both remove the header that they have appended.
void nextId(benchmark::State &state) {
  const File file(state.range(0));
  const Names expected = namesOf(state.range(0));
  const auto size = static_cast<off_t>(file.text().size());
  const int next = static_cast<int>(state.range(0)) + 1;
  const std::string name = "task" + std::to_string(next);
  Race(state,
       [&] {
         return OptionMap::optSectionGetUniqueId(kPath, "task") == next &&
                ::truncate(kPath, size) == 0;
       })
      .peer(
          "read_and_list",
          [&] {
            return readAndList(file.text().size(), expected) && appendHeader(name) &&
                   ::truncate(kPath, size) == 0;
          },
          1.3)
      .run();
}
BENCHMARK(nextId)->Arg(1)->Arg(100)->Arg(1000)->Arg(10000)->Apply(rounds);

bool saveByKeyFile(const std::string &name, int value) {
  const KeyFile file = loadKeyFile();
  g_key_file_set_integer(file.get(), name.c_str(), "option1", value);
  return g_key_file_save_to_file(file.get(), kPath, nullptr) != 0;
}

// Saves wait for the disk, so the slices are short.
void save(benchmark::State &state) {
  const File file(state.range(0));
  const int id = static_cast<int>(state.range(0));
  const std::string name = "task" + std::to_string(id);
  OptionMap map;
  if (!map.optSectionLoad(kPath, "task", id)) {
    state.SkipWithError("load");
    return;
  }
  int runs = 0;
  Race(state, [&] { return map.optSet("option1", ++runs) && map.optSectionSave(); })
      .peer(
          "bare_calls", [&] { return KovaBench::saveByCalls(kPath, file.text()); }, 1.1)
      .peer("gkeyfile", [&] { return saveByKeyFile(name, ++runs); })
      .slice(0.001)
      .run();
}
BENCHMARK(save)->Arg(1)->Arg(100)->Arg(1000)->Arg(10000)->Apply(rounds);

// What the lock and the function cost in addition to the three steps.
void updateSection(benchmark::State &state) {
  using namespace KOVA::Backup::Service;
  const File file(state.range(0));
  const int id = static_cast<int>(state.range(0));
  int runs = 0;
  const auto change = [&](OptionMap &map) { return map.optSet("option1", ++runs); };
  Race(state,
       [&] {
         return KOVA::Backup::Service::updateSection(kPath, "task", id, "section_bench", change) ==
                Update::Saved;
       })
      .peer("load_change_save",
            [&] {
              OptionMap map;
              return map.optSectionLoad(kPath, "task", id) && change(map) && map.optSectionSave();
            })
      .slice(0.001)
      .run();
}
BENCHMARK(updateSection)->Arg(1)->Arg(10000)->Apply(rounds);

} // namespace
