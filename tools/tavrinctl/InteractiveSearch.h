#pragma once

#include <functional>
#include <memory>
#include <string>

namespace tavrin {
struct TAVSearchRequest;
}

namespace tavrin::ctl {

struct Options;

/// Searches with every key typed into the terminal until Ctrl-C or Ctrl-D. `text` is the initial text, `request` makes
/// the request for a text. Throws `Failure` without a daemon or a terminal.
void searchInteractively(const Options& options, const std::string& text,
                         const std::function<std::shared_ptr<TAVSearchRequest>(const std::string&)>& request);

} // namespace tavrin::ctl
