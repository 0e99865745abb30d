// quorletctl completion: completions for shells, made from the commands themselves.
#include <CLI/CLI.hpp>
#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include "ctl/options.h"
#include "ctl/session.h"

namespace quorlet {
namespace {

// A word that may come behind the words of `path`.
struct Candidate {
  std::string path;  // "tally add"; empty at the top
  std::string word;  // "add", "--day"
  std::string description;
  bool takesValue = false;

  bool isOption() const { return word.starts_with("--"); }
};

std::vector<CLI::App*> Subcommands(CLI::App& app) {
  return app.get_subcommands([](CLI::App*) { return true; });
}

// Shells have one line for it.
std::string OneLine(std::string text) {
  std::ranges::replace(text, '\n', ' ');
  return text;
}

void Collect(CLI::App& app, const std::string& path, std::vector<Candidate>& candidates) {
  for (CLI::App* command : Subcommands(app)) {
    candidates.push_back({path, command->get_name(), OneLine(command->get_description())});
  }
  for (const CLI::Option* option : app.get_options()) {
    for (const std::string& name : option->get_lnames()) {
      candidates.push_back({path, "--" + name, OneLine(option->get_description()),
                            option->get_items_expected_max() > 0});
    }
  }
  for (CLI::App* command : Subcommands(app)) {
    Collect(*command, path.empty() ? command->get_name() : path + " " + command->get_name(),
            candidates);
  }
}

// As one word of a shell.
std::string Quoted(std::string_view text) {
  std::string quoted = "'";
  for (const char c : text) {
    if (c == '\'') {
      quoted += "'\\''";
    } else {
      quoted += c;
    }
  }
  return quoted + "'";
}

// "path) words ;;" for each path, the words made by `word`.
template <typename Word>
std::string Cases(const std::vector<Candidate>& candidates, const Word& word) {
  std::string cases;
  const std::string* path = nullptr;
  for (const Candidate& candidate : candidates) {
    if (path == nullptr || *path != candidate.path) {
      cases += (path == nullptr ? "    " : " ;;\n    ") + Quoted(candidate.path) + ") found=(";
    }
    path = &candidate.path;
    cases += (cases.ends_with('(') ? "" : " ") + word(candidate);
    if (&candidate == &candidates.back() || (&candidate + 1)->path != candidate.path) cases += ")";
  }
  return cases + " ;;\n";
}

std::string BashScript(const std::vector<Candidate>& candidates) {
  return R"(_quorletctl_words() {
  case $1 in
)" + Cases(candidates, [](const Candidate& candidate) { return candidate.word; }) +
         R"(    *) found=() ;;
  esac
}
_quorletctl() {
  local path='' word found
  for word in "${COMP_WORDS[@]:1:COMP_CWORD-1}"; do
    _quorletctl_words "$path"
    case $word in -*) continue ;; esac
    case " ${found[*]} " in *" $word "*) path=${path:+$path }$word ;; esac
  done
  _quorletctl_words "$path"
  mapfile -t COMPREPLY < <(compgen -W "${found[*]}" -- "${COMP_WORDS[COMP_CWORD]}")
}
complete -o default -F _quorletctl quorletctl
)";
}

std::string ZshScript(const std::vector<Candidate>& candidates) {
  return R"(#compdef quorletctl
_quorletctl_words() {
  case $1 in
)" +
         Cases(candidates,
               [](const Candidate& candidate) {
                 return Quoted(candidate.word + ":" + candidate.description);
               }) +
         R"(    *) found=() ;;
  esac
}
_quorletctl() {
  local at='' word
  local -a found
  for word in "${(@)words[2,CURRENT-1]}"; do
    _quorletctl_words "$at"
    [[ $word == -* ]] && continue
    (( ${found[(I)$word:*]} )) && at=${at:+$at }$word
  done
  _quorletctl_words "$at"
  _describe 'command or option' found || _files
}
if [[ $funcstack[1] == _quorletctl ]]; then _quorletctl "$@"; else compdef _quorletctl quorletctl; fi
)";
}

std::string FishScript(const std::vector<Candidate>& candidates) {
  std::string script = R"fish(function __quorletctl_path
    set -l path
    for word in (commandline -opc)[2..]
        string match -q -- '-*' $word; or set -a path $word
    end
    echo "$path"
end
function __quorletctl_at
    test (__quorletctl_path) = "$argv"
end
function __quorletctl_below
    string match -q -- "$argv *" (__quorletctl_path)" "
end
complete -c quorletctl -n __quorletctl_at -f
)fish";
  for (const Candidate& candidate : candidates) {
    const std::string condition = candidate.isOption() && !candidate.path.empty()
                                      ? "__quorletctl_below " + candidate.path
                                      : "__quorletctl_at " + candidate.path;
    script +=
        "complete -c quorletctl -n " + Quoted(condition) +
        (candidate.isOption() ? " -l " + candidate.word.substr(2) : " -f -a " + candidate.word) +
        (candidate.takesValue ? " -r" : "") + " -d " + Quoted(candidate.description) + "\n";
  }
  return script;
}

}  // namespace

void AddCompletionCommand(CLI::App& app, Session& session) {
  const auto shell = std::make_shared<std::string>();
  CLI::App* completion =
      AddCommand(app, "completion", "Print the completions for a shell", "",
                 "quorletctl completion bash >/etc/bash_completion.d/quorletctl");
  completion->add_option("SHELL", *shell, "bash, zsh or fish")
      ->required()
      ->check(CLI::IsMember({"bash", "zsh", "fish"}));
  completion->callback([&app, &session, shell] {
    session.command = [&app, &session, shell] {
      std::vector<Candidate> candidates;
      Collect(app, "", candidates);
      session.out.write(*shell == "bash"  ? BashScript(candidates)
                        : *shell == "zsh" ? ZshScript(candidates)
                                          : FishScript(candidates));
    };
  });
}

}  // namespace quorlet
