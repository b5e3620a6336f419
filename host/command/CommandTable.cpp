#include "host/command/CommandTable.h"

#include <CLI/CLI.hpp>

namespace appsync {
namespace {

std::string valueOf(const CLI::Option& option) {
    if (!option.get_option_text().empty()) return option.get_option_text();
    return option.get_items_expected_max() == 0 ? "" : option.get_type_name();
}

OptionEntry entryOf(const CLI::Option& option) {
    OptionEntry entry;
    entry.isPlaced = option.get_positional();
    // With both names of "-h,--help", the long one.
    entry.name = entry.isPlaced || option.get_lnames().empty() ? option.get_name()
                                                               : "--" + option.get_lnames().front();
    entry.description = option.get_description();
    entry.value = valueOf(option);
    entry.isRequired = option.get_required();
    entry.isRepeated = option.get_items_expected_max() > 1 ||
                       option.get_multi_option_policy() == CLI::MultiOptionPolicy::TakeAll;
    return entry;
}

}  // namespace

CommandEntry commandTable(const CLI::App& command) {
    CommandEntry entry;
    entry.name = command.get_name();
    entry.description = command.get_description();
    const std::vector<const CLI::Option*> options = command.get_options();
    entry.options.reserve(options.size());
    for (const CLI::Option* each : options) entry.options.push_back(entryOf(*each));
    for (const CLI::App* each : command.get_subcommands([](const CLI::App*) { return true; })) {
        if (!each->get_group().empty()) entry.commands.push_back(commandTable(*each));
    }
    return entry;
}

}  // namespace appsync
