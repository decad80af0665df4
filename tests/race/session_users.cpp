#include "tests/race/session_users.h"

#include "kovabackup/path_util.h"
#include "tests/race/race_support.h"

#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <sched.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest {
namespace {

using KOVA::Backup::Session;
using KOVA::Base::UniqueFd;

constexpr int kDay = 86400;

// Makes the session old, so that its users alone protect it.
void makeOld(int dir) {
  const timespec then = {std::time(nullptr) - kDay, 0};
  const timespec times[] = {then, then};
  (void)::futimens(dir, times);
}

UniqueFd openFolder(const std::string &path) {
  return UniqueFd(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

// The content of the session's file; "" if it is gone.
std::string markIn(int dir) {
  const UniqueFd file(::openat(dir, "owner", O_RDONLY | O_CLOEXEC));
  char text[64] = "";
  const ssize_t length = file ? ::read(file.get(), text, sizeof text) : 0;
  return {text, static_cast<std::size_t>(length > 0 ? length : 0)};
}

bool isSameFolder(int dir, const std::string &path) {
  struct stat open = {};
  struct stat named = {};
  return ::fstat(dir, &open) == 0 && ::lstat(path.c_str(), &named) == 0 &&
         open.st_dev == named.st_dev && open.st_ino == named.st_ino;
}

} // namespace

// --- KnownIds ---

class KnownIds::Locked {
public:
  explicit Locked(std::atomic<bool> &lock) : lock_(lock) {
    while (lock_.exchange(true)) {
      ::sched_yield();
    }
  }
  ~Locked() { lock_ = false; }
  Locked(const Locked &) = delete;
  Locked &operator=(const Locked &) = delete;

private:
  std::atomic<bool> &lock_;
};

void KnownIds::add(const std::string &id) {
  const Locked locked(locked_);
  std::array<char, 12> &place = ids_[next_++ % ids_.size()];
  place[id.copy(place.data(), place.size() - 1)] = '\0';
}

std::string KnownIds::any() {
  const Locked locked(locked_);
  const unsigned known = std::min(next_, static_cast<unsigned>(ids_.size()));
  return known == 0 ? "" : ids_[asked_++ % known].data();
}

// --- SessionPlay ---

SessionPlay::SessionPlay() : seed(printedSeed()), known(makeShared<KnownIds>()) {}

SessionPlay::~SessionPlay() {
  ::munmap(known, sizeof(KnownIds));
}

// --- SessionUsers ---

void SessionUsers::run(int rounds) {
  for (int round = 0; round < rounds; ++round) {
    switch (random_() % 8) {
    case 0:
    case 1:
    case 2:
      makeAndStay();
      break;
    case 3:
      loseAndStay();
      break;
    case 4:
      if (play_.loads) {
        load();
        break;
      }
      [[fallthrough]];
    default:
      visit();
    }
  }
}

// Until it is old nothing removes it, except by its ID, which is not known yet.
bool SessionUsers::make(Entered &made) {
  Session session;
  const bool created = random_() % 3 == 0
                           ? session.create()
                           : session.create(boost::make_shared<FixedFilter>(play_.folder));
  if (!created) {
    play_.complain("a session cannot be created");
    return false;
  }
  made.id = session.getId();
  made.path = session.getPath();
  made.mark = made.id + " " + std::to_string(random_());
  std::ofstream(made.path + "/owner") << made.mark << std::flush;
  std::filesystem::create_directories(made.path + "/folder/below");
  made.dir = openFolder(made.path);
  makeOld(made.dir.get());
  return true;
}

void SessionUsers::makeAndStay() {
  Entered made;
  if (make(made)) {
    play_.known->add(made.id);
    stay(made);
  }
}

// As after a restart of the machine, which has emptied /tmp.
void SessionUsers::loseAndStay() {
  Entered made;
  if (!make(made) || made.path == std::string(kSessionRoot) + "/" + made.id) {
    return;
  }
  (void)::unlink(linkOf(made.id).c_str());
  made.id.clear();
  stay(made);
}

void SessionUsers::visit() {
  Entered entered;
  entered.id = play_.known->any();
  entered.path = entered.id.empty() ? "" : Session::getPathById(entered.id);
  if (entered.path.empty()) {
    return;
  }
  entered.dir = openFolder(entered.path);
  if (!entered.dir) {
    return; // gone
  }
  entered.mark = markIn(entered.dir.get());
  if (entered.mark.empty()) {
    complainOf(entered, "is being removed when it is entered");
    return;
  }
  stay(entered);
}

// Only the time protects the session then.
void SessionUsers::load() {
  Session session;
  const std::string id = play_.known->any();
  if (id.empty() || !session.load(id)) {
    return;
  }
  ++*play_.entered;
  pause(20000000);
  const Entered loaded = {id, session.getPath(), "", UniqueFd()};
  if (!checkFound(loaded)) {
    complainOf(loaded, "was loaded and is removed");
  }
}

// Under the lock of the session root no store is between renaming a session and giving it its name
// back.
bool SessionUsers::checkFound(const Entered &entered) const {
  const UniqueFd root(::open(kSessionRoot, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!root || ::flock(root.get(), LOCK_EX) != 0) {
    play_.complain("the session root cannot be locked");
    return false;
  }
  const std::string path = entered.id.empty() ? entered.path : Session::getPathById(entered.id);
  const bool found = path == entered.path && isThere(path);
  (void)::flock(root.get(), LOCK_UN);
  return found;
}

void SessionUsers::stay(const Entered &entered) {
  ++*play_.entered;
  const int looks = 1 + static_cast<int>(random_() % 4);
  for (int look = 0; look < looks; ++look) {
    pause(5000000);
    if (markIn(entered.dir.get()) != entered.mark) {
      complainOf(entered, "is removed while it is in use");
      return;
    }
    *play_.moved += isSameFolder(entered.dir.get(), entered.path) ? 0 : 1;
  }
  if (!checkFound(entered)) {
    complainOf(entered, "is in use and not found by its ID");
  }
}

void SessionUsers::pause(unsigned most) {
  const timespec span = {0, static_cast<long>(random_() % most)};
  (void)::nanosleep(&span, nullptr);
}

void SessionUsers::complainOf(const Entered &entered, const std::string &what) const {
  play_.complain("session [" + entered.id + "] " + entered.path + " " + what);
}

} // namespace KovaTest
