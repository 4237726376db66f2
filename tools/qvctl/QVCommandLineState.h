#pragma once

#include "tools/qvctl/QVCommandLine.h"

#include <charconv>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <CLI/App.hpp>
#include <CLI/Config.hpp>
#include <CLI/Formatter.hpp>

// What QVCommandLine keeps: the parser, what it fills, and which command it found. Included by the
// sources of QVCommandLine alone.
struct QVCommandLine::State {
  CLI::App app{"Controls and inspects the QuietVox reporting service."};
  std::string socket;
  std::string root;
  bool json = false;
  Action action;

  // Behind the options of every command.
  static constexpr const char* kFooter =
      "Exit status: 0 done, 1 failed, 2 wrong usage, 3 the service is not running, cannot be\n"
      "reached or does not answer, 4 not permitted; session run: that of its command.\n"
      "Names of service types, categories and message types, in any case, and their numbers are\n"
      "taken alike: telephony or 2, Session.Playback or 0x08000003, Start or 1. See qvctl(1).";
  // And of those that take entries of messages or configurations.
  static constexpr const char* kEntries =
      "Entries: frames=480 is an integer, gain=1.5 a double, on=true a boolean, route=speaker a\n"
      "string; KEY:KIND=VALUE gives the kind, int, uint, double, bool, string or json:\n"
      "gain:double=1 name:string=5 device:json={\"a\":[1,2]}";

  // What is wrong. Where a command is missing, the parser does not say what stands in its place.
  static std::string complaint(const CLI::App& app, const CLI::ParseError& error);

  // Options of every command.
  void addPlaces(CLI::App& command);
  void addJSON(CLI::App& command);
  // The whole of a word as a number within limits; the parser itself takes "-1" for a very large
  // number of no sign, and cuts what is too large.
  template <class Number>
  static Number number(const std::string& name, const std::string& word,
                       Number least = std::numeric_limits<Number>::min(),
                       Number most = std::numeric_limits<Number>::max()) {
    Number value{};
    const char* const end = word.data() + word.size();
    const auto [stop, problem] = std::from_chars(word.data(), end, value);
    if (problem != std::errc() || stop != end || value < least || value > most) {
      throw CLI::ValidationError(name, std::string("\"")
                                           .append(word)
                                           .append("\" is no number from ")
                                           .append(std::to_string(least))
                                           .append(" to ")
                                           .append(std::to_string(most)));
    }
    return value;
  }
  // An option or argument that is such a number. What `target` is in is kept by the command.
  template <class Number, class Target>
  static CLI::Option* addNumber(CLI::App& command, const std::string& name, Target& target,
                                const char* description,
                                Number least = std::numeric_limits<Number>::min(),
                                Number most = std::numeric_limits<Number>::max()) {
    const auto take = [name, &target, least, most](const CLI::results_t& words) {
      target = number<Number>(name, words.front(), least, most);
      return true;
    };
    return command.add_option(name, CLI::callback_t(take), description);
  }
  // Several words behind one option, with commas between.
  template <class Target>
  static CLI::Option* addList(CLI::App& command, const char* name, Target& target,
                              const char* description, const char* words) {
    return command.add_option(name, target, description)
        ->option_text(words)
        ->delimiter(',')
        ->allow_extra_args(false);
  }
  // An option that takes an empty word for a value would take it for none.
  static void refuseEmptyWords(const CLI::App& command);
  // Commands with a word before them: "summary list", "summary show".
  CLI::App& addFamily(const char* name, const char* description);
  // One of them, of those that Command::run() carries out.
  template <class Command>
  auto addMember(CLI::App& family, typename Command::Operation operation, const char* name,
                 const char* description) {
    auto added = add<Command>(family, name, description);
    added.second->operation = operation;
    return added;
  }
  // A command that is carried out by Command::run(context, options).
  template <class Command>
  std::pair<CLI::App*, std::shared_ptr<typename Command::Options>> add(CLI::App& parent,
                                                                       const char* name,
                                                                       const char* description) {
    CLI::App* const command = parent.add_subcommand(name, description);
    addPlaces(*command);
    auto options = std::make_shared<typename Command::Options>();
    command->callback([this, options] {
      action = [options](const QVToolContext& context) { return Command::run(context, *options); };
    });
    return {command, options};
  }
};
