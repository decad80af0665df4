#include "option/section_list.h"

#include "common/log.h"
#include "kovabackup/option_map.h"
#include "option/option_map_private.h"

#include <cstdlib>
#include <string_view>

namespace KOVA::Backup {
namespace {

constexpr int kFirstCapacity = 1024;

constexpr SectionListReport kListId = {848, 856, 860, ""};
constexpr SectionListReport kListName = {887, 895, 899, " failed"};

} // namespace

SectionList::SectionList(const SectionListReport &report)
    : report_(report), errorBefore_(KLIBCErrGet()) {}

SectionList::~SectionList() {
  KLIBCSzListFree(list_);
}

bool SectionList::allocate() {
  list_ = KLIBCSzListAlloc(kFirstCapacity);
  if (list_ != nullptr) {
    return true;
  }
  const auto error = PlatformError::last();
  Log::error(kOptionModule, report_.allocFailed, "KLIBCSzListAlloc: [0x%04X %s:%d]", error.code,
             error.file, error.line);
  return false;
}

bool SectionList::read(const std::string &path) {
  listed_ = KLIBCFileEnumSection(path.c_str(), &list_) >= 0;
  if (listed_) {
    return true;
  }
  const auto error = PlatformError::last();
  if (error.code == kNoSuchFile) {
    KLIBCErrSetEx(errorBefore_, kOptionModule, report_.noFile);
    return true;
  }
  Log::error(kOptionModule, report_.enumFailed, "KLIBCFileEnumSection[%s]%s: [0x%04X %s:%d]",
             path.c_str(), report_.enumFailedSuffix, error.code, error.file, error.line);
  return false;
}

int SectionList::count() const {
  return listed_ ? list_->count : 0;
}

const char *SectionList::name(int index) const {
  return KLIBCSzListGet(list_, index);
}

bool parseSectionId(const char *name, const std::string &prefix, int &id) {
  if (name == nullptr || std::string_view(name).substr(0, prefix.size()) != prefix) {
    return false;
  }
  id = static_cast<int>(std::strtol(name + prefix.size(), nullptr, 10));
  return true;
}

bool OptionMap::optSectionListId(const std::string &path, const std::string &prefix,
                                 std::list<int> &ids) {
  SectionList sections(kListId);
  if (!sections.allocate()) {
    return false;
  }
  ids.clear();
  if (!sections.read(path)) {
    return false;
  }
  for (int index = 0; index < sections.count(); ++index) {
    int id = 0;
    if (parseSectionId(sections.name(index), prefix, id)) {
      ids.push_back(id);
    }
  }
  return true;
}

bool OptionMap::optSectionListName(const std::string &path, std::list<std::string> &names) {
  SectionList sections(kListName);
  if (!sections.allocate()) {
    return false;
  }
  names.clear();
  if (!sections.read(path)) {
    return false;
  }
  for (int index = 0; index < sections.count(); ++index) {
    const char *name = sections.name(index);
    if (name != nullptr) {
      names.emplace_back(name);
    } else {
      Log::error(kOptionModule, 906, "KLIBCSzListGet[%s] index[%d] failed", path.c_str(), index);
    }
  }
  return true;
}

} // namespace KOVA::Backup
