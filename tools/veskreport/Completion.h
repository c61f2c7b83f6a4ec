// Completion scripts for shells.
#pragma once

#include <string>
#include <string_view>

namespace CLI {
class App;
}

namespace vesk {

/// A script that completes the commands and options of `app`. `shell`: "bash", "zsh" or "fish".
std::string completionScript(const CLI::App& app, std::string_view shell);

}  // namespace vesk
