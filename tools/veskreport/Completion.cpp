#include "tools/veskreport/Completion.h"

#include <CLI/CLI.hpp>
#include <functional>
#include <vector>

namespace vesk {

namespace {

struct Word {
  std::string text;
  std::string description;
  bool isOption;
};

std::vector<Word> wordsOf(const CLI::App& app) {
  std::vector<Word> words;
  for (const CLI::App* sub : app.get_subcommands([](auto) { return true; }))
    words.push_back({sub->get_name(), sub->get_description(), false});
  for (const CLI::Option* option : app.get_options()) {
    for (const auto& name : option->get_lnames()) words.push_back({name, option->get_description(), true});
  }
  return words;
}

/// Calls `visit` with each command's path, such as "storebag sign", the program's own ("") first.
void forEach(const CLI::App& app, const std::string& path,
             const std::function<void(const std::string&, const CLI::App&)>& visit) {
  visit(path, app);
  for (const CLI::App* sub : app.get_subcommands([](auto) { return true; }))
    forEach(*sub, path.empty() ? sub->get_name() : path + " " + sub->get_name(), visit);
}

std::string firstLine(const std::string& text) {
  std::string plain;
  for (char c : text.substr(0, text.find('\n'))) {
    if (c == '\'' || c == '\\') continue;  // would end the quotes
    if (c == ':') plain += '\\';           // separates a word from its description in zsh
    plain += c;
  }
  return plain;
}

constexpr char kFindPath[] =
    "  local path='' word\n"
    "  for word in \"${before[@]}\"; do\n"
    "    case \"${path:+$path }$word\" in\n"
    "      @PATHS@) path=\"${path:+$path }$word\";;\n"
    "    esac\n"
    "  done\n"
    "  case \"$path\" in\n";

std::string findPath(const CLI::App& app) {
  std::string paths;
  forEach(app, "", [&](const std::string& path, const CLI::App&) {
    if (!path.empty()) paths += (paths.empty() ? "'" : "|'") + path + "'";
  });
  std::string text = kFindPath;
  return text.replace(text.find("@PATHS@"), 7, paths);
}

std::string bashScript(const CLI::App& app) {
  std::string text =
      "_veskreport() {\n  local before=(\"${COMP_WORDS[@]:1:COMP_CWORD-1}\")\n" + findPath(app);
  forEach(app, "", [&](const std::string& path, const CLI::App& command) {
    text += "    '" + path + "') COMPREPLY=($(compgen -W '";
    for (const Word& word : wordsOf(command)) text += (word.isOption ? " --" : " ") + word.text;
    text += "' -- \"${COMP_WORDS[COMP_CWORD]}\"));;\n";
  });
  return text + "  esac\n}\ncomplete -o default -F _veskreport veskreport\n";
}

std::string zshScript(const CLI::App& app) {
  std::string text =
      "#compdef veskreport\n_veskreport() {\n  local before=(\"${words[@]:1:$((CURRENT-2))}\") items\n" +
      findPath(app);
  forEach(app, "", [&](const std::string& path, const CLI::App& command) {
    text += "    '" + path + "') items=(";
    for (const Word& word : wordsOf(command))
      text += "'" + (word.isOption ? "--" + word.text : word.text) + ":" + firstLine(word.description) + "' ";
    text += ");;\n";
  });
  return text + "  esac\n  _describe veskreport items || _files\n}\n_veskreport \"$@\"\n";
}

std::string fishScript(const CLI::App& app) {
  std::string text;
  forEach(app, "", [&](const std::string& path, const CLI::App& command) {
    // Each word of the path has to be on the line, and none of the commands below it.
    std::string condition;
    for (std::size_t at = 0; at < path.size();) {
      const auto end = std::min(path.find(' ', at), path.size());
      condition += "__fish_seen_subcommand_from " + path.substr(at, end - at) + "; and ";
      at = end + 1;
    }
    std::string below;
    for (const Word& word : wordsOf(command)) below += word.isOption ? "" : " " + word.text;
    condition += below.empty() ? "true" : "not __fish_seen_subcommand_from" + below;
    for (const Word& word : wordsOf(command)) {
      text += "complete -c veskreport -n '" + condition + "' " + (word.isOption ? "-l " : "-f -a ") +
              word.text + " -d '" + firstLine(word.description) + "'\n";
    }
  });
  return text;
}

}  // namespace

std::string completionScript(const CLI::App& app, std::string_view shell) {
  if (shell == "zsh") return zshScript(app);
  return shell == "fish" ? fishScript(app) : bashScript(app);
}

}  // namespace vesk
