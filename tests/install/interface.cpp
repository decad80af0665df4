// The exact interface: argument types, results, const, static, conversions and copies. Callers were
// compiled against it, so any change fails here. This file needs only the public headers and
// declared.h: it compiles wherever they do.

#include "kovabackup/exec.h"
#include "kovabackup/network.h"
#include "kovabackup/nodiscard.h"
#include "kovabackup/option_map.h"
#include "kovabackup/path_filter.h"
#include "kovabackup/path_kova.h"
#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "kovabackup/signal.h"
#include "kovabackup/string_util.h"
#include "kovabackup/subprocess.h"
#include "kovabackup/temp_manager.h"
#include "kovabackup/volume_path_manager.h"

#include "declared.h"

#include <ostream>
#include <type_traits>
#include <utility>

using namespace KOVA::Backup; // NOLINT(google-build-using-namespace): one list of all its names

namespace Interface {

using Text = const std::string &;
using Texts = std::list<std::string>;
using Strings = std::vector<std::string>;
using Filter = boost::shared_ptr<FilterVolume>;

// --- string_util.h ---

template struct Declared<std::string (*)(const char *, va_list), &vstringf>;
template struct Declared<std::string (*)(const char *, ...), &stringf>;
template struct Declared<std::string (*)(Text, boost::function<bool(Text, std::string &)>),
                         &replaceMustache>;
template struct Declared<std::string (*)(Text, const std::map<std::string, std::string> &),
                         &replaceMustache>;
template struct Declared<std::string (*)(Text, const Json::Value &, bool), &replaceMustache>;
template struct Declared<bool (_VarsMapperMapString::*)(Text, std::string &) const,
                         &_VarsMapperMapString::operator()>;
template struct Declared<bool (_VarsMapperJson::*)(Text, std::string &) const,
                         &_VarsMapperJson::operator()>;
static_assert(
    std::is_constructible<_VarsMapperMapString, const std::map<std::string, std::string> &>::value,
    "is made from a map");
static_assert(std::is_constructible<_VarsMapperJson, const Json::Value &, bool>::value,
              "is made from a value and the choice of form");

// --- path_util.h, path_kova.h ---

template struct Declared<std::string (*)(Text), &Path::dirname>;
template struct Declared<std::string (*)(Text), &Path::basename>;
template struct Declared<std::string (*)(Text, Text), &Path::join>;
template struct Declared<std::string (*)(Text, Text, Text, Text, Text, Text, Text), &Path::join>;
template struct Declared<std::string (*)(Strings::const_iterator, Strings::const_iterator),
                         &Path::join>;
template struct Declared<std::string (*)(const Strings &), &Path::join>;
template struct Declared<bool (*)(Text, Strings &), &Path::split>;
template struct Declared<std::string (*)(Text, unsigned int), &Path::token>;
template struct Declared<std::string (*)(Text, Text), &Path::common>;
template struct Declared<std::string (*)(Text, Text), &Path::relative>;
template struct Declared<std::string (*)(Text), &Path::absPath>;
template struct Declared<std::string (*)(), &Path::getIpcTempPath>;
template struct Declared<std::string (*)(Text, unsigned int), &Path::createIpcTempPath>;
template struct Declared<int (*)(Text), &Path::createIpcLockFile>;
template struct Declared<std::string (*)(Text), &ConfigPath::shareName>;
template struct Declared<std::string (*)(Text), &ConfigPath::shareRelativePath>;
template struct Declared<bool (*)(Text), &removeAll>;
template struct Declared<std::string (*)(Text), &Path::getShareName>;
template struct Declared<bool (*)(Text), &Path::isInKovaEaDir>;

// --- path_filter.h ---

template struct Declared<bool (PathFilter::*)(Text), &PathFilter::addIncludePattern>;
template struct Declared<bool (PathFilter::*)(Texts &), &PathFilter::addIncludePattern>;
template struct Declared<bool (PathFilter::*)(Text), &PathFilter::addExcludePattern>;
template struct Declared<bool (PathFilter::*)(Texts &), &PathFilter::addExcludePattern>;
template struct Declared<bool (PathFilter::*)(Text), &PathFilter::filterOut>;
template struct Declared<bool (PathFilter::*)(Texts &, Text), &PathFilter::getIncludePattern>;
template struct Declared<bool (PathFilter::*)(Texts &, Text), &PathFilter::getExcludePattern>;
static_assert(std::is_default_constructible<PathFilter>::value, "is made without arguments");
static_assert(IsNeitherCopiedNorMoved<PathFilter>::value, "owns its patterns");

// --- subprocess.h, exec.h, signal.h ---

static_assert(std::is_convertible<const char *, const SubProcess &>::value,
              "a program is a command");
static_assert(std::is_convertible<std::string, const SubProcess &>::value,
              "a program is a command");
static_assert(std::is_convertible<Texts, const SubProcess &>::value, "a list is a command");
static_assert(std::is_convertible<Strings, const SubProcess &>::value, "a list is a command");
static_assert(IsNeitherCopiedNorMoved<SubProcess>::value, "owns its record");
template struct Declared<void (SubProcess::*)(Text), &SubProcess::addArg>;
template struct Declared<void (SubProcess::*)(const char *, ...), &SubProcess::addArgList>;
template struct Declared<void (SubProcess::*)(const char *, ...), &SubProcess::addFormatArg>;
template struct Declared<void (SubProcess::*)(Text, Text), &SubProcess::setEnv>;
template struct Declared<void (SubProcess::*)(Text, int), &SubProcess::setStdOutput>;
template struct Declared<void (SubProcess::*)(int), &SubProcess::setStdOutput>;
template struct Declared<void (SubProcess::*)(Text, int), &SubProcess::setStdError>;
template struct Declared<void (SubProcess::*)(int), &SubProcess::setStdError>;
template struct Declared<std::string (SubProcess::*)() const, &SubProcess::toString>;
template struct Declared<int (SubProcess::*)() const, &SubProcess::call>;
template struct Declared<bool (SubProcess::*)(bool) const, &SubProcess::callBackground>;
template struct Declared<bool (SubProcess::*)() const, &SubProcess::exec>;

static_assert(std::is_default_constructible<UtilExec>::value, "is made without arguments");
template struct Declared<int (UtilExec::*)(const char *, char *const *, void (*)(int, int)),
                         &UtilExec::Execv>;
template struct Declared<void (UtilExec::*)(), &UtilExec::SetSigHandler>;
template struct Declared<void (UtilExec::*)(), &UtilExec::RestoreSigHandler>;
template struct Declared<bool (*)(int), &Process::isAlive>;
template struct Declared<int (*)(int), &Process::getStatus>;
template struct Declared<bool (*)(int), &Process::isZombie>;

template struct Declared<bool (*)(int, void (*)(int)), &signalHandlerSet>;
template struct Declared<bool (*)(int, int), &signalHandlerSetFlags>;
template struct Declared<bool (*)(int, int, int &), &signalHandlerAddFlags>;
template struct Declared<bool (*)(int, int, int &), &signalHandlerRemoveFlags>;
static_assert(std::is_default_constructible<ScopedTempSigHandler>::value, "holds none at first");
static_assert(IsNeitherCopiedNorMoved<ScopedTempSigHandler>::value, "restores once");
template struct Declared<bool (ScopedTempSigHandler::*)(int, int, void (*)(int)),
                         &ScopedTempSigHandler::setSignalHandler>;

// --- network.h ---

template struct Declared<std::string (*)(Text), &Net::getIpFromAddr>;
template struct Declared<int (*)(const char *, int, int), &Net::testIpAndPortConnect>;

// --- volume_path_manager.h ---

/// The constructors of a maximum filter: X(), explicit X(bool), X(int, int, bool).
template <typename Max>
struct IsMaxFilter {
  static constexpr bool value =
      std::is_base_of<FilterVolume, Max>::value && std::is_default_constructible<Max>::value &&
      std::is_constructible<Max, bool>::value && !std::is_convertible<bool, const Max &>::value &&
      std::is_constructible<Max, int, int, bool>::value;
};

static_assert(std::is_abstract<FilterVolume>::value, "is a rule yet to be made");
static_assert(std::has_virtual_destructor<FilterVolume>::value, "is destroyed through itself");
static_assert(IsMaxFilter<FilterMaxVolume>::value, "is made in three ways");
static_assert(IsMaxFilter<FilterMaxExtVolume>::value, "is made in three ways");
static_assert(IsMaxFilter<FilterMaxExtBtrfsVolume>::value, "is made in three ways");
static_assert(std::is_base_of<FilterVolume, FilterSameVolume>::value, "is a filter");
static_assert(std::is_constructible<FilterSameVolume, Text>::value, "is made from a path");
static_assert(!std::is_convertible<std::string, const FilterSameVolume &>::value,
              "only when asked for");
template struct Declared<bool (FilterVolume::*)(int &, int &) const,
                         &FilterVolume::getVolumeEnumParameter>;
template struct Declared<bool (FilterVolume::*)(const KOVAVOLInfo &), &FilterVolume::isAccept>;
template struct Declared<std::string (FilterVolume::*)() const, &FilterVolume::defaultPath>;
template struct Declared<std::string (FilterVolume::*)() const, &FilterVolume::getSignature>;
template struct Declared<VolumePathManager &(*)(), &VolumePathManager::getInstance>;
template struct Declared<bool (VolumePathManager::*)(Filter, std::string &),
                         &VolumePathManager::getVolumePath>;
static_assert(IsNeitherCopiedNorMoved<VolumePathManager>::value, "there is one");

// --- temp_manager.h ---

static_assert(std::is_default_constructible<ScopedTempFile>::value, "owns nothing at first");
static_assert(std::is_constructible<ScopedTempFile, int>::value, "owns nothing at first");
static_assert(!std::is_convertible<int, const ScopedTempFile &>::value, "only when asked for");
static_assert(std::is_constructible<ScopedTempFile, Text, bool>::value, "makes a file");
static_assert(!std::is_constructible<ScopedTempFile, Text>::value, "says what becomes of it");
static_assert(std::has_virtual_destructor<ScopedTempFile>::value, "is destroyed through itself");
static_assert(IsNeitherCopiedNorMoved<ScopedTempFile>::value, "removes once");
template struct Declared<bool (ScopedTempFile::*)(Text), &ScopedTempFile::create>;
template struct Declared<bool (ScopedTempFile::*)() const, &ScopedTempFile::isValid>;
template struct Declared<std::string (ScopedTempFile::*)() const, &ScopedTempFile::getPath>;
template struct Declared<int (ScopedTempFile::*)() const, &ScopedTempFile::getFileDescripter>;
template struct Declared<void (ScopedTempFile::*)(), &ScopedTempFile::close>;
template struct Declared<void (ScopedTempFile::*)(), &ScopedTempFile::unlink>;
template struct Declared<bool (ScopedTempFile::*)(Text), &ScopedTempFile::rename>;
template struct Declared<std::string (ScopedTempFile::*)(), &ScopedTempFile::preserve>;
static_assert(std::is_base_of<ScopedTempFile, ScopedVolumeTempFile>::value, "is a file");
static_assert(std::is_constructible<ScopedVolumeTempFile, Filter, Text, bool>::value,
              "makes a file on a volume");
static_assert(IsNeitherCopiedNorMoved<ScopedVolumeTempFile>::value, "removes once");

static_assert(std::is_default_constructible<ScopedTempFolder>::value, "owns nothing at first");
static_assert(std::is_constructible<ScopedTempFolder, int>::value, "owns nothing at first");
static_assert(!std::is_convertible<int, const ScopedTempFolder &>::value, "only when asked for");
static_assert(std::is_constructible<ScopedTempFolder, Text>::value, "makes a folder");
static_assert(!std::is_convertible<std::string, const ScopedTempFolder &>::value,
              "only when asked for");
static_assert(std::has_virtual_destructor<ScopedTempFolder>::value, "is destroyed through itself");
static_assert(IsNeitherCopiedNorMoved<ScopedTempFolder>::value, "removes once");
template struct Declared<bool (ScopedTempFolder::*)(Text), &ScopedTempFolder::create>;
template struct Declared<bool (ScopedTempFolder::*)() const, &ScopedTempFolder::isValid>;
template struct Declared<std::string (ScopedTempFolder::*)() const, &ScopedTempFolder::getPath>;
template struct Declared<void (ScopedTempFolder::*)(), &ScopedTempFolder::unlink>;
template struct Declared<bool (ScopedTempFolder::*)(Text), &ScopedTempFolder::rename>;
template struct Declared<std::string (ScopedTempFolder::*)(), &ScopedTempFolder::preserve>;
static_assert(std::is_base_of<ScopedTempFolder, ScopedVolumeTempFolder>::value, "is a folder");
static_assert(std::is_constructible<ScopedVolumeTempFolder, Filter, Text>::value,
              "makes a folder on a volume");
static_assert(IsNeitherCopiedNorMoved<ScopedVolumeTempFolder>::value, "removes once");

template struct Declared<Filter (*)(), &TempManager::maxVolume>;
template struct Declared<Filter (*)(bool), &TempManager::maxVolume>;
template struct Declared<Filter (*)(int, int, bool), &TempManager::maxVolume>;
template struct Declared<Filter (*)(), &TempManager::maxExtVolume>;
template struct Declared<Filter (*)(bool), &TempManager::maxExtVolume>;
template struct Declared<Filter (*)(int, int, bool), &TempManager::maxExtVolume>;
template struct Declared<Filter (*)(), &TempManager::maxExtBtrfsVolume>;
template struct Declared<Filter (*)(bool), &TempManager::maxExtBtrfsVolume>;
template struct Declared<Filter (*)(int, int, bool), &TempManager::maxExtBtrfsVolume>;
template struct Declared<Filter (*)(Text), &TempManager::sameVolume>;

// --- option_map.h ---

static_assert(std::is_default_constructible<OptionMap>::value, "is empty at first");
static_assert(std::is_copy_constructible<OptionMap>::value, "is copied");
static_assert(std::is_copy_assignable<OptionMap>::value, "is copied");
template struct Declared < OptionMap &(OptionMap::*)(const OptionMap &), &OptionMap::operator=>;
template struct Declared<bool (OptionMap::*)(OptionMap &) const, &OptionMap::optCloneTo>;
template struct Declared<std::string (OptionMap::*)(Text, Text) const, &OptionMap::optString>;
template struct Declared<std::string (OptionMap::*)(Text, Text) const, &OptionMap::optSecret>;
template struct Declared<int (OptionMap::*)(Text, int) const, &OptionMap::optInt>;
template struct Declared<bool (OptionMap::*)(Text, bool) const, &OptionMap::optBool>;
template struct Declared<bool (OptionMap::*)(Text, std::string &, bool) const, &OptionMap::optGet>;
template struct Declared<bool (OptionMap::*)(Text, char *, unsigned int, bool) const,
                         &OptionMap::optGet>;
template struct Declared<bool (OptionMap::*)(Text, int &) const, &OptionMap::optGet>;
template struct Declared<bool (OptionMap::*)(Text, long long &) const, &OptionMap::optGet>;
template struct Declared<bool (OptionMap::*)(Text, bool &) const, &OptionMap::optGet>;
template struct Declared<bool (OptionMap::*)(Text, Texts &) const, &OptionMap::optGet>;
template struct Declared<bool (OptionMap::*)(Text, Text, bool), &OptionMap::optSet>;
template struct Declared<bool (OptionMap::*)(Text, const char *, bool), &OptionMap::optSet>;
template struct Declared<bool (OptionMap::*)(Text, int), &OptionMap::optSet>;
template struct Declared<bool (OptionMap::*)(Text, long long), &OptionMap::optSet>;
template struct Declared<bool (OptionMap::*)(Text, bool), &OptionMap::optSet>;
template struct Declared<bool (OptionMap::*)(Text, const Texts &), &OptionMap::optSet>;
template struct Declared<bool (OptionMap::*)(Text), &OptionMap::optRemove>;
template struct Declared<bool (OptionMap::*)(), &OptionMap::optClear>;
template struct Declared<bool (OptionMap::*)() const, &OptionMap::optIsLoaded>;
template struct Declared<int (OptionMap::*)() const, &OptionMap::optSectionGetId>;
template struct Declared<std::string (OptionMap::*)() const, &OptionMap::optSectionGetName>;
template struct Declared<std::string (OptionMap::*)() const, &OptionMap::optToJsonString>;
template struct Declared<bool (OptionMap::*)(Text), &OptionMap::optLoadJsonString>;
template struct Declared<bool (OptionMap::*)(Text), &OptionMap::optAppendJsonString>;
template struct Declared<bool (OptionMap::*)(Text, Text, int), &OptionMap::optSectionLoad>;
template struct Declared<bool (OptionMap::*)(), &OptionMap::optSectionSave>;
template struct Declared<bool (OptionMap::*)(Text, Text, int), &OptionMap::optSectionCreate>;
template struct Declared<bool (OptionMap::*)(Text, Text, bool), &OptionMap::optSectionCreate>;
template struct Declared<bool (OptionMap::*)(), &OptionMap::optSectionRemove>;
template struct Declared<bool (OptionMap::*)(Text, Text, bool) const, &OptionMap::optSectionExport>;
template struct Declared<bool (*)(Text, Text, std::list<int> &), &OptionMap::optSectionListId>;
template struct Declared<bool (*)(Text, Texts &), &OptionMap::optSectionListName>;
template struct Declared<int (*)(Text, Text), &OptionMap::optSectionGetUniqueId>;
template struct Declared<bool (*)(Text, Text, int), &OptionMap::optSectionCreateUniqueId>;
template struct Declared<bool (*)(Text, Text), &OptionMap::optSectionCreateUniqueName>;
template struct Declared<bool (OptionMap::*)(Text), &OptionMap::setLockToken>;
template struct Declared<bool (OptionMap::*)(), &OptionMap::lock>;
template struct Declared<bool (OptionMap::*)(), &OptionMap::unlock>;

// secret is false by default.
static_assert(sizeof(std::declval<OptionMap>().optGet("", std::declval<std::string &>())) != 0, "");
static_assert(sizeof(std::declval<OptionMap>().optGet("", std::declval<char *>(), 1U)) != 0, "");
static_assert(sizeof(std::declval<OptionMap>().optSet("", std::string())) != 0, "");
static_assert(std::is_same<std::ostream &, decltype(std::declval<std::ostream &>()
                                                    << std::declval<const OptionMap &>())>::value,
              "is written to a stream");

// --- session.h ---

static_assert(std::is_default_constructible<Session>::value, "holds none at first");
static_assert(IsNeitherCopiedNorMoved<Session>::value, "owns its record");
template struct Declared<bool (Session::*)(), &Session::create>;
template struct Declared<bool (Session::*)(Filter), &Session::create>;
template struct Declared<bool (Session::*)(Text), &Session::load>;
template struct Declared<bool (Session::*)(), &Session::destroy>;
template struct Declared<std::string (Session::*)() const, &Session::getId>;
template struct Declared<std::string (Session::*)() const, &Session::getPath>;
template struct Declared<std::string (*)(Text), &Session::getPathById>;
template struct Declared<bool (*)(Text), &Session::destroyById>;

} // namespace Interface
