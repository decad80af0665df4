// The exact interface of the second library; see interface.cpp.

#include "kovabackup/service/cancel.h"
#include "kovabackup/service/command.h"
#include "kovabackup/service/error.h"
#include "kovabackup/service/millis.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/service/run_lock.h"
#include "kovabackup/service/section_update.h"
#include "kovabackup/service/session_store.h"
#include "kovabackup/service/tree_removal.h"
#include "kovabackup/service/tree_walk.h"

#include "declared.h"

#include <utility>

using namespace KOVA::Backup;          // NOLINT(google-build-using-namespace): one list of names
using namespace KOVA::Backup::Service; // NOLINT(google-build-using-namespace): one list of names

namespace Interface {

using Text = const std::string &;

template <typename Class>
struct IsOnlyMoved {
  static constexpr bool value = !std::is_copy_constructible<Class>::value &&
                                !std::is_copy_assignable<Class>::value &&
                                std::is_nothrow_move_constructible<Class>::value &&
                                std::is_nothrow_move_assignable<Class>::value;
};

/// IsMember<type, &Class::member> is true for a member of exactly that type.
template <typename Type, auto member>
struct IsMember : std::false_type {};
template <typename Type, typename Class, Type Class::*member>
struct IsMember<Type, member> : std::true_type {};

// --- error.h ---

static_assert(IsMember<int, &Error::code>::value, "0 for no failure");
static_assert(IsMember<std::string, &Error::step>::value, "the call");
static_assert(IsMember<std::string, &Error::path>::value, "its object");

// --- cancel.h ---

static_assert(std::is_default_constructible<Cancel>::value, "has no request at first");
static_assert(IsNeitherCopiedNorMoved<Cancel>::value, "owns its descriptor");
template struct Declared<void (Cancel::*)() noexcept, &Cancel::request>;
template struct Declared<bool (Cancel::*)() const noexcept, &Cancel::requested>;
template struct Declared<int (Cancel::*)() const noexcept, &Cancel::fd>;

// --- millis.h ---

static_assert(std::is_same<Millis, std::chrono::milliseconds>::value, "a time span");

// --- command.h ---

static_assert(IsMember<std::string, &Captured::text>::value, "what was kept");
static_assert(IsMember<std::uint64_t, &Captured::dropped>::value, "what was not");
static_assert(IsMember<Result::End, &Result::end>::value, "how the command ended");
static_assert(IsMember<int, &Result::code>::value, "its status or signal");
static_assert(IsMember<bool, &Result::timedOut>::value, "why it ended");
static_assert(IsMember<bool, &Result::cancelled>::value, "why it ended");
static_assert(IsMember<bool, &Result::killed>::value, "why it ended");
static_assert(IsMember<Error, &Result::error>::value, "the step that failed");
static_assert(IsMember<Captured, &Result::out>::value, "a stream");
static_assert(IsMember<Captured, &Result::err>::value, "a stream");
static_assert(IsMember<struct rusage, &Result::usage>::value, "what it used");
static_assert(IsMember<std::chrono::nanoseconds, &Result::wall>::value, "how long it ran");
template struct Declared<bool (Result::*)() const, &Result::ok>;
static_assert(Result::End::NotStarted != Result::End::Exited &&
                  Result::End::Signalled != Result::End::StatusLost,
              "the ends of a command");

static_assert(std::is_constructible<Command, std::vector<std::string>>::value, "takes arguments");
static_assert(!std::is_convertible<std::vector<std::string>, Command>::value,
              "only when asked for");
static_assert(IsOnlyMoved<Command>::value, "owns its description");
template struct Declared<Command &(Command::*)(Text, Text), &Command::env>;
template struct Declared<Command &(Command::*)(std::string), &Command::input>;
template struct Declared<Command &(Command::*)(int), &Command::inputFd>;
template struct Declared<Command &(Command::*)(Stream, std::size_t), &Command::capture>;
template struct Declared<Command &(Command::*)(Stream, std::function<void(std::string_view)>,
                                               std::size_t),
                         &Command::lines>;
template struct Declared<Command &(Command::*)(Stream, int), &Command::toFd>;
template struct Declared<Command &(Command::*)(Stream, Text, int), &Command::toFile>;
template struct Declared<Command &(Command::*)(int, int), &Command::passFd>;
template struct Declared<Command &(Command::*)(Millis, Millis), &Command::limit>;
template struct Declared<Command &(Command::*)(bool), &Command::ownGroup>;
template struct Declared<Command &(Command::*)(bool), &Command::diesWithUs>;
template struct Declared<Command &(Command::*)(Millis, std::function<void()>), &Command::every>;
template struct Declared<Command &(Command::*)(Cancel &), &Command::cancelledBy>;
template struct Declared<Result (Command::*)() const, &Command::run>;
template struct Declared<Running (Command::*)() const, &Command::start>;

static_assert(!std::is_default_constructible<Running>::value, "only a Command starts one");
static_assert(IsOnlyMoved<Running>::value, "owns its child");
template struct Declared<pid_t (Running::*)() const noexcept, &Running::pid>;
template struct Declared<Result (Running::*)(), &Running::wait>;
template struct Declared<std::size_t (*)(const std::vector<Running *> &, Millis),
                         &Running::waitAny>;
template struct Declared<std::vector<Result> (*)(const std::vector<const Command *> &, Millis),
                         &runPipeline>;

// These calls leave out what has a default.
static_assert(sizeof(std::declval<Command>().lines(Stream::Out, nullptr)) != 0, "");
static_assert(sizeof(std::declval<Command>().toFile(Stream::Err, "")) != 0, "");
static_assert(sizeof(std::declval<Command>().limit(Millis(1))) != 0, "");
static_assert(sizeof(std::declval<Command>().ownGroup()) != 0, "");
static_assert(sizeof(std::declval<Command>().diesWithUs()) != 0, "");
static_assert(sizeof(Running::waitAny({})) != 0, "");
static_assert(sizeof(runPipeline({})) != 0, "");

// --- published_file.h ---

static_assert(std::is_constructible<PublishedFile, Text>::value, "has a mode by default");
static_assert(std::is_constructible<PublishedFile, Text, mode_t>::value, "takes a mode");
static_assert(!std::is_convertible<std::string, PublishedFile>::value, "only when asked for");
static_assert(IsNeitherCopiedNorMoved<PublishedFile>::value, "owns its file");
template struct Declared<bool (PublishedFile::*)(Error &, std::uint64_t), &PublishedFile::create>;
template struct Declared<int (PublishedFile::*)() const noexcept, &PublishedFile::fd>;
template struct Declared<bool (PublishedFile::*)(Error &), &PublishedFile::publish>;
static_assert(sizeof(std::declval<PublishedFile>().create(std::declval<Error &>())) != 0, "");

// --- run_lock.h ---

static_assert(IsMember<pid_t, &LockHolder::taker>::value, "who took the lock");
static_assert(IsMember<bool, &LockHolder::alive>::value, "whether it has ended");
static_assert(IsMember<std::time_t, &LockHolder::since>::value, "when it took the lock");
static_assert(IsMember<pid_t, &LockUser::pid>::value, "a process");
static_assert(IsMember<bool, &LockUser::waits>::value, "what it does");
static_assert(IsMember<std::string, &LockUser::command>::value, "its name");

static_assert(std::is_constructible<RunLock, Text>::value, "has a name");
static_assert(!std::is_convertible<std::string, RunLock>::value, "only when asked for");
static_assert(IsNeitherCopiedNorMoved<RunLock>::value, "owns the lock");
template struct Declared<bool (RunLock::*)(Error &, Millis), &RunLock::take>;
template struct Declared<void (RunLock::*)(), &RunLock::release>;
template struct Declared<int (RunLock::*)() const noexcept, &RunLock::fd>;
template struct Declared<std::string (*)(Text), &RunLock::path>;
template struct Declared<bool (*)(Text, LockHolder &), &RunLock::holder>;
template struct Declared<bool (*)(Text, std::vector<LockUser> &, Error &), &RunLock::users>;
static_assert(sizeof(std::declval<RunLock>().take(std::declval<Error &>())) != 0, "");

// --- section_update.h ---

static_assert(Update::Saved != Update::Declined && Update::NoSection != Update::Locked &&
                  Update::LockFailed != Update::LoadFailed && Update::SaveFailed != Update::Saved,
              "what becomes of an update");
template struct Declared<Update (*)(Text, Text, int, Text, const std::function<bool(OptionMap &)> &,
                                    Millis, Error *),
                         &updateSection>;
static_assert(sizeof(updateSection("", "", 1, "", nullptr)) != 0, "");

// --- session_store.h ---

static_assert(IsMember<pid_t, &SessionUser::pid>::value, "a process");
static_assert(IsMember<std::string, &SessionUser::command>::value, "its name");
static_assert(IsMember<SessionInfo::State, &SessionInfo::state>::value, "a session");
static_assert(IsMember<std::string, &SessionInfo::id>::value, "its name");
static_assert(IsMember<std::string, &SessionInfo::path>::value, "its place");
static_assert(IsMember<bool, &SessionInfo::onVolume>::value, "its place");
static_assert(IsMember<std::chrono::seconds, &SessionInfo::age>::value, "its age");
static_assert(IsMember<std::string, &SessionInfo::problem>::value, "what is wrong");
static_assert(SessionInfo::State::Complete != SessionInfo::State::Dangling &&
                  SessionInfo::State::Lost != SessionInfo::State::Broken &&
                  SessionInfo::State::Foreign != SessionInfo::State::Complete,
              "the states of a session");
static_assert(IsMember<std::string, &SessionPart::name>::value, "an entry");
static_assert(IsMember<std::uint64_t, &SessionPart::bytes>::value, "its size");
static_assert(IsMember<std::chrono::seconds, &SessionRemoval::olderThan>::value, "what is spared");
static_assert(IsMember<bool, &SessionRemoval::evenInUse>::value, "what is spared");
static_assert(IsMember<std::vector<SessionPart>, &SessionRemoval::parts>::value, "the order");
static_assert(IsMember<std::function<void(std::uint64_t)>, &SessionRemoval::gone>::value,
              "the progress");

static_assert(std::is_default_constructible<SessionStore>::value, "has no state");
template struct Declared<bool (*)(Text), &SessionStore::isId>;
template struct Declared<std::string (*)(), &SessionStore::root>;
template struct Declared<bool (SessionStore::*)(std::vector<SessionInfo> &, Error &),
                         &SessionStore::list>;
template struct Declared<bool (SessionStore::*)(Text, SessionInfo &, Error &), &SessionStore::find>;
template struct Declared<bool (SessionStore::*)(const SessionInfo &, std::vector<SessionUser> &),
                         &SessionStore::users>;
template struct Declared<bool (SessionStore::*)(const SessionInfo &, std::uint64_t &,
                                                std::uint64_t &, Error &,
                                                std::vector<SessionPart> *),
                         &SessionStore::size>;
template struct Declared<bool (SessionStore::*)(const SessionInfo &, std::string &, Error &),
                         &SessionStore::adopt>;
template struct Declared<bool (SessionStore::*)(const SessionInfo &, Error &,
                                                const SessionRemoval &),
                         &SessionStore::remove>;
template struct Declared<bool (SessionStore::*)(std::chrono::seconds, bool,
                                                std::vector<SessionInfo> &, std::vector<Error> &),
                         &SessionStore::prune>;
template struct Declared<bool (SessionStore::*)(Error &), &SessionStore::trusted>;
static_assert(sizeof(std::declval<SessionStore>().remove({}, std::declval<Error &>())) != 0, "");
static_assert(sizeof(std::declval<SessionStore>().size({}, std::declval<std::uint64_t &>(),
                                                       std::declval<std::uint64_t &>(),
                                                       std::declval<Error &>())) != 0,
              "");

// --- tree_removal.h ---

static_assert(std::is_same<TreeRemoval::Report, std::function<void(const Error &)>>::value,
              "gets each failure");
static_assert(!std::is_default_constructible<TreeRemoval>::value, "has no objects");
template struct Declared<bool (*)(Text, const TreeRemoval::Report &), &TreeRemoval::remove>;
static_assert(sizeof(TreeRemoval::remove("")) != 0, "");

// --- tree_walk.h ---

static_assert(IsMember<bool, &WalkOptions::oneFileSystem>::value, "what is not entered");
static_assert(IsMember<bool, &WalkOptions::skipCaches>::value, "what is not entered");
static_assert(IsMember<bool, &WalkOptions::leftOutCloses>::value, "what is not entered");
static_assert(IsMember<std::vector<std::string>, &WalkOptions::leaveOut>::value,
              "what is not returned");
static_assert(IsMember<std::string, &WalkEntry::path>::value, "an entry");
static_assert(IsMember<mode_t, &WalkEntry::mode>::value, "its type");
static_assert(IsMember<uid_t, &WalkEntry::uid>::value, "its owner");
static_assert(IsMember<gid_t, &WalkEntry::gid>::value, "its group");
static_assert(IsMember<dev_t, &WalkEntry::device>::value, "its identity");
static_assert(IsMember<std::uint64_t, &WalkEntry::inode>::value, "its identity");
static_assert(IsMember<std::uint64_t, &WalkEntry::links>::value, "its names");
static_assert(IsMember<std::uint64_t, &WalkEntry::size>::value, "its size");
static_assert(IsMember<timespec, &WalkEntry::modified>::value, "its times");
static_assert(IsMember<timespec, &WalkEntry::changed>::value, "its times");
static_assert(IsMember<bool, &WalkEntry::kept>::value, "what the filter says");
static_assert(IsMember<Error, &WalkEntry::error>::value, "what failed on it");

static_assert(std::is_constructible<TreeWalk, Text, PathFilter &>::value, "has options if wanted");
static_assert(std::is_constructible<TreeWalk, Text, PathFilter &, const WalkOptions &>::value,
              "takes options");
static_assert(IsNeitherCopiedNorMoved<TreeWalk>::value, "owns its descriptors");
template struct Declared<bool (TreeWalk::*)(WalkEntry &), &TreeWalk::next>;
template struct Declared<void (TreeWalk::*)(), &TreeWalk::skipFolder>;
template struct Declared<bool (TreeWalk::*)(std::string &, Error &), &TreeWalk::linkTarget>;
template struct Declared<bool (TreeWalk::*)(std::string &), &TreeWalk::decidedBy>;

} // namespace Interface
