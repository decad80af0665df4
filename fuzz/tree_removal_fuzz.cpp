// The removal of a tree of real files, while others change it or system calls fail. Nothing outside
// of the tree is removed. The result says whether anything is left at the path, and what is left
// was reported. A tree that no one disturbs is removed without a report, by the first library's
// removal, too. No descriptor is left.
//
// Input: the tree as fuzz/tree.h says, a byte that chooses, and what happens: for each event one
// byte for the number of the call before which it happens, one for the kind of the event and those
// of the paths that it affects.

#include "kovabackup/path_util.h"
#include "kovabackup/service/tree_removal.h"

#include "fuzz/support.h"
#include "fuzz/tree.h"
#include "tests/service/tree_hooks.h"
#include "tests/support/fault.h"

#include <fstream>
#include <memory>
#include <string>

namespace {

namespace fs = std::filesystem;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::TreeRemoval;
using KovaFuzz::require;

const std::string kWorld = "/tmp/world";
const std::string kRoot = kWorld + "/tree";
const std::string kMoved = kWorld + "/moved";

// What others do to the tree.
struct Event {
  unsigned call = 0;
  unsigned kind = 0;
  std::string one;
  std::string other;
};

void happen(const Event &event) {
  std::error_code ignored;
  switch (event.kind % 6) {
  case 0:
    fs::rename(event.one, event.other, ignored);
    break;
  case 1: // its place is taken by a link that leads out
    fs::rename(event.one, kMoved + "/" + std::to_string(event.call), ignored);
    fs::create_directory_symlink(KovaFuzz::kLinkTarget, event.one, ignored);
    break;
  case 2:
    fs::create_directories(event.one + "/new", ignored);
    break;
  case 3:
    (void)::mknod((event.one + "new").c_str(), S_IFREG | 0644, 0);
    break;
  case 4:
    fs::remove_all(event.one, ignored);
    break;
  default:
    fs::create_directory_symlink(KovaFuzz::kLinkTarget, event.one + "link", ignored);
  }
}

// What others only add is removed as well.
bool onlyAdd(const std::vector<Event> &events) {
  return std::all_of(events.begin(), events.end(), [](const Event &event) {
    const unsigned kind = event.kind % 6;
    return kind == 2 || kind == 3 || kind == 5;
  });
}

struct FailingCall {
  const char *name;
  int code;
};

constexpr std::array<FailingCall, 8> kFailingCalls = {{{"openat2", EACCES},
                                                       {"openat2", EMFILE},
                                                       {"openat2", ENOSYS},
                                                       {"getdents64", EIO},
                                                       {"unlinkat", EPERM},
                                                       {"unlinkat", EBUSY},
                                                       {"openat", ENOMEM},
                                                       {"statx", EIO}}};

// The folder that holds the tree and what is outside of it.
class World {
public:
  World() {
    clear();
    fs::create_directories(KovaFuzz::kLinkTarget + "/folder");
    fs::create_directory(kMoved);
    std::ofstream(file()) << "content";
  }
  ~World() { clear(); }
  World(const World &) = delete;
  World &operator=(const World &) = delete;

  static bool isOutsideComplete() {
    std::error_code ignored;
    return fs::file_size(file(), ignored) == 7;
  }

private:
  static std::string file() { return KovaFuzz::kLinkTarget + "/folder/file"; }
  static void clear() { fs::remove_all(kWorld); }
};

bool exists(const std::string &path) {
  struct stat found = {};
  return ::lstat(path.c_str(), &found) == 0;
}

std::vector<Event> takeEvents(KovaFuzz::Input &input, const KovaFuzz::Tree &tree) {
  std::vector<Event> events;
  while (!input.empty() && events.size() < 8) {
    Event event;
    event.call = input.byte();
    event.kind = input.byte();
    event.one = tree.somePath(input);
    event.other = event.kind % 6 == 0 ? tree.somePath(input) : "";
    events.push_back(event);
  }
  return events;
}

// Returns: how many failures were reported.
std::size_t remove(const std::vector<Event> &events) {
  unsigned calls = 0;
  KovaTest::beforeCall = [&](const std::string &, const char *) {
    for (const Event &event : events) {
      if (event.call == calls) {
        happen(event);
      }
    }
    ++calls;
  };
  std::size_t reports = 0;
  const bool gone = TreeRemoval::remove(kRoot, [&](const Error &error) {
    require(error.code != 0 && !error.step.empty());
    ++reports;
  });
  KovaTest::beforeCall = nullptr;
  require(gone || reports > 0);
  require(gone == !exists(kRoot) || !events.empty()); // others may have made it again or removed it
  return reports;
}

void checkFailing(KovaFuzz::Input &input) {
  const FailingCall &call = kFailingCalls[input.byte() % kFailingCalls.size()];
  const KovaTest::Fault fault(call.name, 1 + static_cast<int>(input.byte() % 64), call.code,
                              input.byte() % 2 == 1);
  const std::size_t reports = remove({});
  require(fault.fired() || (reports == 0 && !exists(kRoot)));
}

void checkDisturbed(const std::vector<Event> &events) {
  const std::size_t reports = remove(events);
  require(!onlyAdd(events) || (reports == 0 && !exists(kRoot)));
}

void checkUndisturbed() {
  require(remove({}) == 0 && !exists(kRoot));
}

void checkFirstLibrary() {
  require(KOVA::Backup::removeAll(kRoot) && !exists(kRoot));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  const World world;
  KovaFuzz::Tree tree(kRoot);
  tree.make(input);
  const int free = KovaFuzz::nextDescriptor();
  switch (input.byte() % 4) {
  case 0:
    checkUndisturbed();
    break;
  case 1:
    checkFirstLibrary();
    break;
  case 2:
    checkFailing(input);
    break;
  default:
    checkDisturbed(takeEvents(input, tree));
  }
  require(KovaFuzz::nextDescriptor() == free);
  require(World::isOutsideComplete());
  return 0;
}
