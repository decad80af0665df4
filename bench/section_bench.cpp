// Section files, compared with what a caller would write instead. The peer reads the lines into a
// list of sections with streams, changes the list and writes it back, either in place, as is
// common, or through a synced temporary file. The latter is as durable as the service, but does not
// keep owner and attributes and may leave the temporary file behind. Every result is checked before
// it is measured. The file is in the working directory, so run the benchmark on the file system of
// interest.

#include "kovaplatform/kovacore.h"

#include <benchmark/benchmark.h>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <fstream>
#include <sstream>
#include <string>
#include <unistd.h>
#include <vector>

namespace {

constexpr const char *kPath = "section_bench.conf";

std::string sectionsText(std::int64_t count) {
  std::string text;
  for (std::int64_t i = 0; i < count; ++i) {
    text += "[task" + std::to_string(i) + "]\nenabled=true\nname=\"the task\"\nruns=0\n\n";
  }
  return text;
}

std::string readText() {
  std::ifstream in(kPath, std::ios::binary);
  std::ostringstream out;
  out << in.rdbuf();
  return out.str();
}

class File {
public:
  explicit File(std::int64_t sections) { std::ofstream(kPath) << sectionsText(sections); }
  ~File() { std::remove(kPath); }
  File(const File &) = delete;
  File &operator=(const File &) = delete;
};

void require(bool holds, const char *what) {
  if (!holds) {
    std::fprintf(stderr, "wrong result: %s\n", what);
    std::abort();
  }
}

// The peer's data.
struct Section {
  std::string name;
  std::vector<std::string> lines;
};

std::vector<Section> parse() {
  std::vector<Section> sections;
  std::ifstream in(kPath);
  for (std::string line; std::getline(in, line);) {
    if (line.size() >= 2 && line.front() == '[' && line.back() == ']') {
      sections.push_back({line.substr(1, line.size() - 2), {}});
    } else if (!sections.empty()) {
      sections.back().lines.push_back(line);
    }
  }
  return sections;
}

void print(const std::vector<Section> &sections, const std::string &path) {
  std::ofstream out(path);
  for (const Section &section : sections) {
    out << '[' << section.name << "]\n";
    for (const std::string &line : section.lines) {
      out << line << '\n';
    }
  }
}

void syncPath(const char *path) {
  const int fd = ::open(path, O_RDONLY | O_CLOEXEC);
  require(::fsync(fd) == 0, "fsync");
  ::close(fd);
}

void setByStreams(const std::string &name, const std::string &runs, bool durable) {
  std::vector<Section> sections = parse();
  for (Section &section : sections) {
    if (section.name == name) {
      section.lines = {"enabled=true", "name=\"the task\"", "runs=" + runs, ""};
    }
  }
  const std::string path = durable ? std::string(kPath) + ".tmp" : kPath;
  print(sections, path);
  if (durable) {
    syncPath(path.c_str());
    require(std::rename(path.c_str(), kPath) == 0, "rename");
    syncPath(".");
  }
}

void setByService(const std::string &name, const std::string &runs) {
  KLIBCSzHash *hash = KLIBCSzHashAlloc(1024);
  (void)KLIBCSzHashSetValue(&hash, "enabled", "true");
  (void)KLIBCSzHashSetValue(&hash, "name", "\"the task\"");
  (void)KLIBCSzHashSetValue(&hash, "runs", runs.c_str());
  require(KLIBCFileSetSection(kPath, name.c_str(), nullptr, hash, 0) == 1, "set");
  KLIBCSzHashFree(hash);
}

// Changes the last section, so that the complete file is read.
template <typename Set>
void measureSet(benchmark::State &state, Set set) {
  const File file(state.range(0));
  const std::string name = "task" + std::to_string(state.range(0) - 1);
  std::string expected = sectionsText(state.range(0));
  expected.replace(expected.rfind("runs=0"), 6, "runs=7");
  set(name, "7");
  require(readText() == expected, "the file after a change");
  int runs = 0;
  for (auto _ : state) {
    set(name, std::to_string(++runs));
  }
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(expected.size()));
}

void setService(benchmark::State &state) {
  measureSet(state, setByService);
}

void setStreamsDurable(benchmark::State &state) {
  measureSet(state, [](const std::string &name, const std::string &runs) {
    setByStreams(name, runs, true);
  });
}

void setStreamsInPlace(benchmark::State &state) {
  measureSet(state, [](const std::string &name, const std::string &runs) {
    setByStreams(name, runs, false);
  });
}

void enumService(benchmark::State &state) {
  const File file(state.range(0));
  for (auto _ : state) {
    KLIBCSzList *list = KLIBCSzListAlloc(1024);
    require(KLIBCFileEnumSection(kPath, &list) >= 0 && list->count == state.range(0), "names");
    KLIBCSzListFree(list);
  }
}

void enumStreams(benchmark::State &state) {
  const File file(state.range(0));
  for (auto _ : state) {
    require(static_cast<std::int64_t>(parse().size()) == state.range(0), "names");
  }
}

void encrypt(benchmark::State &state) {
  const std::string text(static_cast<std::size_t>(state.range(0)), 'x');
  std::string buffer((text.size() + 2) * 2, '\0');
  for (auto _ : state) {
    require(KLIBCCryptSzEncrypt(text.c_str(), buffer.data(), static_cast<int>(buffer.size())) != 0,
            "encryption");
  }
}

void decrypt(benchmark::State &state) {
  const std::string text(static_cast<std::size_t>(state.range(0)), 'x');
  std::string cipher((text.size() + 2) * 2, '\0');
  (void)KLIBCCryptSzEncrypt(text.c_str(), cipher.data(), static_cast<int>(cipher.size()));
  std::string buffer(cipher.size(), '\0');
  for (auto _ : state) {
    require(KLIBCCryptSzDecrypt(cipher.c_str(), buffer.data(), static_cast<int>(buffer.size())) !=
                0,
            "decryption");
  }
  require(text == buffer.c_str(), "the text after decryption");
}

BENCHMARK(setService)->Arg(10)->Arg(1000)->Arg(100000);
BENCHMARK(setStreamsDurable)->Arg(10)->Arg(1000)->Arg(100000);
BENCHMARK(setStreamsInPlace)->Arg(10)->Arg(1000)->Arg(100000);
BENCHMARK(enumService)->Arg(10)->Arg(1000)->Arg(100000);
BENCHMARK(enumStreams)->Arg(10)->Arg(1000)->Arg(100000);
BENCHMARK(encrypt)->Arg(16)->Arg(4096);
BENCHMARK(decrypt)->Arg(16)->Arg(4096);

} // namespace
