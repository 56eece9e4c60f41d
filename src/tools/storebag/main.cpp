// SPDX-License-Identifier: Apache-2.0
// veltra-storebag: makes keys; signs, verifies, shows and checks storebags. The exit status is 0 if done, 1
// if refused, failed or with findings, 2 for wrong usage.
#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <string>

#include "storebag/options.h"

int main(int count, char** arguments) {
  try {
    CLI::App app;
    veltrad::storebag::Arguments given;
    veltrad::storebag::describe(app, given);
    try {
      app.parse(count, arguments);
    } catch (const CLI::ParseError& error) {
      return app.exit(error) == 0 ? 0 : 2;
    }
    std::FILE* stream = given.outcome.done ? stdout : stderr;
    const std::string text =
        given.outcome.done ? given.outcome.text : "veltra-storebag: " + given.outcome.text + "\n";
    const bool written =
        std::fwrite(text.data(), 1, text.size(), stream) == text.size() && std::fflush(stream) == 0;
    if (!written && given.outcome.done) std::perror("veltra-storebag: standard output");
    for (const std::string& line : given.outcome.failures)
      std::fprintf(stderr, "veltra-storebag: %s\n", line.c_str());
    const bool clean = !given.outcome.findings && given.outcome.failures.empty();
    return given.outcome.done && written && clean ? 0 : 1;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "veltra-storebag: %s\n", error.what());
    return 1;
  }
}
