#include "tools/kovabackup/commands/completions.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "tools/kovabackup/commands/session_view.h"
#include "tools/kovabackup/facts/catalogue.h"
#include "tools/kovabackup/facts/folder_names.h"
#include "tools/kovabackup/facts/section_editor.h"
#include "tools/kovabackup/facts/sessions.h"

#include <fmt/format.h>
#include <list>

namespace KOVA::Backup::Tool {
namespace {

std::vector<SessionInfo> allSessions() {
  std::vector<SessionInfo> sessions;
  Service::Error error;
  (void)SessionStore().list(sessions, error); // what cannot be listed is not offered
  return sessions;
}

} // namespace

std::vector<Candidate> sessionIds(const std::vector<std::string> &) {
  std::vector<Candidate> ids;
  for (const SessionInfo &session : allSessions()) {
    if (!session.id.empty()) {
      ids.push_back(
          {session.id, fmt::format("{}, {}", kindName(session), stateName(session.state))});
    }
  }
  return ids;
}

std::vector<Candidate> lostSessions(const std::vector<std::string> &) {
  std::vector<Candidate> paths;
  for (const SessionInfo &session : allSessions()) {
    if (session.state == SessionInfo::State::Lost) {
      paths.push_back({session.path, ""});
    }
  }
  return paths;
}

std::vector<Candidate> sectionNames(const std::vector<std::string> &arguments) {
  const std::string &file = arguments.at(0);
  requireSectionFile(file);
  std::list<std::string> found;
  (void)OptionMap::optSectionListName(file, found); // on failure there is nothing to offer
  std::vector<Candidate> names;
  for (const std::string &name : found) {
    names.push_back({name, ""});
  }
  return names;
}

std::vector<Candidate> optionNames(const std::vector<std::string> &arguments) {
  OptionMap map;
  loadSection(map, arguments.at(0), arguments.at(1));
  std::vector<Candidate> names;
  for (const std::string &name : valuesOf(map).getMemberNames()) {
    names.push_back({name, ""});
  }
  return names;
}

std::vector<Candidate> optionTypes(const std::vector<std::string> &) {
  return {{"string", "text as it is given"},
          {"int", "a decimal integer"},
          {"bool", "true or false"},
          {"list", "any number of strings"}};
}

std::vector<Candidate> lockTokens(const std::vector<std::string> &) {
  const std::string folder = Path::join(Path::getIpcTempPath(), "lock");
  std::vector<std::string> names;
  (void)addNamesIn(folder, names); // an absent or unreadable folder has nothing to offer
  std::vector<Candidate> tokens;
  tokens.reserve(names.size());
  for (const std::string &name : names) {
    tokens.push_back({name, ""});
  }
  return tokens;
}

std::vector<Candidate> volumeRules(const std::vector<std::string> &) {
  return {{"max", "the largest volume"},
          {"max-ext", "the largest ext volume"},
          {"max-ext-btrfs", "the largest ext or btrfs volume"},
          {"same:", "the volume of a path, as in same:/volume1/photo"}};
}

std::vector<Candidate> messageIds(const std::vector<std::string> &) {
  std::vector<Candidate> ids;
  for (const LogMessage &message : allMessages()) {
    ids.push_back({message.id, message.text});
  }
  return ids;
}

std::vector<Candidate> ages(const std::vector<std::string> &) {
  return {{"1d", "one day"}, {"7d", "a week"}, {"30d", "thirty days"}};
}

} // namespace KOVA::Backup::Tool
