#include "tests/tools/completion_shells.h"

#include "tests/support/child_process.h"
#include "tests/tools/run_tool.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <sstream>

namespace KovaTest {
namespace {

std::string source(const std::string &file) {
  return std::string(KOVA_COMPLETION_DIR) + "/" + file;
}

// One call of the shell's own function ask for each line: `ask WORDS LAST`.
std::string askings(const std::vector<Typed> &lines) {
  std::string text;
  for (const Typed &line : lines) {
    text += "ask '" + line.words + "' '" + line.last + "'\n";
  }
  return text;
}

// Readline splits words at = and :, and the last of the pieces is the word that it completes.
std::string bashScript(const std::vector<Typed> &lines) {
  return "source '" + source("kovabackup.bash") + R"sh('
ask() {
  local pieces
  echo "== $1"
  mapfile -t pieces < <(grep -oE '[=:]+|[^=:]+' <<<"$2")
  [[ -n $2 ]] || pieces=('')
  COMP_WORDS=(kovabackup $1 "${pieces[@]}")
  COMP_CWORD=$((${#COMP_WORDS[@]} - 1))
  local last=${COMP_WORDS[COMP_CWORD]}
  [[ $last == [=:]* ]] && last=''
  _kovabackup kovabackup "$last" "${COMP_WORDS[COMP_CWORD - 1]}"
  printf '%s\n' "${COMPREPLY[@]}"
}
)sh" + askings(lines) +
         "exit 0\n";
}

std::string fishScript(const std::vector<Typed> &lines) {
  return "source '" + source("kovabackup.fish") + R"sh('
function ask
  echo "== $argv[1]"
  complete -C (string join ' ' (string match -v '' kovabackup $argv[1]))" $argv[2]" |
      string replace -r '\t.*' ''
end
)sh" + askings(lines) +
         "exit 0\n";
}

// The completion system of zsh works only in a line editor on a terminal. There each line is put
// into the editor, and every match that reaches the shell's compadd is written down.
std::string zshScript(const std::vector<Typed> &lines) {
  return R"sh(
export FOLDER=${0:h}
cat >$FOLDER/.zshrc <<'END'
fpath=(')sh" +
         std::string(KOVA_COMPLETION_DIR) + R"sh(' $fpath)
autoload -Uz compinit && compinit -u -D
LISTMAX=100000 # asks no questions about long lists
compadd() {
  local -a matches
  if ((!${@[(I)-[OAD]]})); then # with one of these it only fills arrays
    builtin compadd -A matches "$@"
    print -rl -- $matches >>$FOLDER/offered
  fi
  builtin compadd "$@"
}
ask() {
  print -r -- "== $1" >>$FOLDER/offered
  BUFFER="kovabackup ${1:+$1 }$2"
  CURSOR=$#BUFFER
  zle list-choices
}
zle-line-init() {
)sh" + askings(lines) +
         R"sh(
  exit
}
zle -N zle-line-init
END
zmodload zsh/zpty
zpty shell "ZDOTDIR=$FOLDER zsh -d -i"
while zpty -r shell shown; do :; done
cat $FOLDER/offered
)sh";
}

} // namespace

bool hasShell(const std::string &shell) {
  return std::filesystem::exists("/usr/bin/" + shell) || std::filesystem::exists("/bin/" + shell);
}

Offered askShell(const std::string &shell, const std::vector<Typed> &lines) {
  const TestFolder folder;
  writeFile(folder / "script", shell == "bash"   ? bashScript(lines)
                               : shell == "fish" ? fishScript(lines)
                                                 : zshScript(lines));
  const std::map<std::string, std::string> calls = {
      {"bash", "bash --norc "}, {"fish", "fish --no-config "}, {"zsh", "zsh -f "}};
  const std::string tool = std::filesystem::path(KOVA_TOOL_PATH).parent_path().string();
  const ShellResult result =
      runShell("HOME='" + folder.path() + "' PATH='" + tool + "':\"$PATH\" " + calls.at(shell) +
               (folder / "script") + " 2>&1");
  EXPECT_EQ(0, result.exitCode) << result.output;
  std::istringstream shown(result.output);
  Offered offered;
  std::string words;
  for (std::string line; std::getline(shown, line);) {
    if (line.compare(0, 2, "==") == 0) {
      words = line.size() > 3 ? line.substr(3) : "";
      offered[words];
    } else if (!line.empty()) {
      offered[words].insert(line);
    }
  }
  return offered;
}

} // namespace KovaTest
