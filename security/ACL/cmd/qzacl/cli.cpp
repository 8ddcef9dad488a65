// The command line. CLI11 parses only the options. Words are taken from what it leaves over, because among its own it
// gives a special meaning to "++", to words in brackets and to the names of subcommands.
#include "cli.h"

#include "trouble.h"
#include "whole_file.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <charconv>

namespace qzacl {

namespace {

// An option with one value each time it is given. CLI11 would take any number, and split one in brackets.
CLI::Option *one_value(CLI::Option *option) { return option->expected(1)->allow_extra_args(false); }

void add_list(CLI::App &app, const std::string &name, std::vector<std::string> &values) {
    one_value(app.add_option(name, values))->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
}

// Of the verbs' own options by name, those that were given.
class option_reader {
public:
    explicit option_reader(command_line &line) {
        app_.set_help_flag();
        app_.allow_extras();
        app_.add_flag("-h,--help", line.wants_help)->disable_flag_override();
        app_.add_flag("--json", line.is_json)->disable_flag_override();
        one_value(app_.add_option("--permissions", line.permissions));
        one_value(app_.add_option("-m", line.mechanism));
        add_list(app_, "-g", line.groups);
        one_value(app_.add_option("-w", line.wanted));
        one_value(app_.add_option("--order", order_));
        add_list(app_, "--handler", line.handlers);
        app_.add_flag("--check", line.checks)->disable_flag_override();
        app_.add_flag("-s", line.compiles)->disable_flag_override();
        one_value(app_.add_option("--wait", wait_));
    }

    // Returns the words that are not options, and all words after "--".
    std::vector<std::string> read(command_line &line, const std::vector<std::string> &arguments) {
        refuse_odd_forms(arguments);
        try {
            app_.parse(std::vector<std::string>(arguments.rbegin(), arguments.rend()));
        } catch (const CLI::Error &error) {
            throw wrong_use(error.what());
        }
        if (order_ != "closest" && order_ != "sum")
            throw wrong_use("--order is closest or sum");
        line.takes_sum = order_ == "sum";
        line.wait = seconds_of(wait_);
        return words_of(app_.remaining());
    }

    // The names of all options that were given.
    std::vector<std::string> given() const {
        std::vector<std::string> names;
        for (const CLI::Option *option :
             app_.get_options([](const CLI::Option *each) { return each->count() != 0; }))
            names.push_back(option->get_name());
        return names;
    }

private:
    // CLI11 would take the next word as the value of "--order=", "--json=true" as "--json", and "-s-" as "-s --".
    void refuse_odd_forms(const std::vector<std::string> &arguments) const {
        bool is_value = false;
        for (const std::string &argument : arguments) {
            if (is_value)
                is_value = false;
            else if (argument == "--")
                return;
            else if (argument.compare(0, 2, "--") == 0)
                is_value = wants_value(argument);
            else if (argument[0] == '-')
                is_value = letters_want_value(argument);
        }
    }

    static bool takes_value(const CLI::Option *option) {
        return option != nullptr && option->get_items_expected_max() != 0;
    }

    // Whether the next argument is the value of "--name".
    bool wants_value(const std::string &argument) const {
        const std::size_t equals = argument.find('=');
        const CLI::Option *option = app_.get_option_no_throw(argument.substr(0, equals));
        if (equals == std::string::npos || option == nullptr)
            return takes_value(option);
        if (!takes_value(option))
            throw wrong_use(option->get_name() + " takes no value");
        if (equals + 1 == argument.size())
            throw wrong_use(argument + " needs a value");
        return false;
    }

    // The same of the last letter of "-abc".
    bool letters_want_value(const std::string &argument) const {
        for (std::size_t at = 1; at < argument.size(); ++at) {
            if (argument[at] == '-')
                throw wrong_use("there is no option " + argument);
            if (takes_value(app_.get_option_no_throw(std::string("-") + argument[at])))
                return at + 1 == argument.size();
        }
        return false;
    }

    // CLI11 would take no digits at all for 0.
    static unsigned seconds_of(const std::string &digits) {
        unsigned seconds = 0;
        const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), seconds);
        if (error != std::errc() || end != digits.data() + digits.size())
            throw wrong_use("--wait is a number of seconds");
        return seconds;
    }

    static std::vector<std::string> words_of(std::vector<std::string> left) {
        const auto mark = std::find(left.begin(), left.end(), "--");
        for (auto word = left.begin(); word != mark; ++word) {
            if (word->size() > 1 && word->front() == '-')
                throw wrong_use("there is no option " + *word);
        }
        if (mark != left.end())
            left.erase(mark);
        return left;
    }

    CLI::App app_;
    std::string order_ = "closest";
    std::string wait_ = "10";
};

const verb &find_verb(std::span<const verb> verbs, const std::string &name) {
    const auto found =
        std::find_if(verbs.begin(), verbs.end(), [&](const verb &each) { return each.name == name; });
    if (found == verbs.end())
        throw wrong_use("there is no verb " + name);
    return *found;
}

bool takes(const verb &chosen, const std::string &option) {
    const std::string common = " -h,--help --json --permissions ";
    const std::string own = " " + std::string(chosen.options) + " ";
    return (common + own).find(" " + option + " ") != std::string::npos;
}

void check_words(const command_line &line) {
    const verb &chosen = *line.chosen;
    const std::size_t count = line.words.size();
    if (count < chosen.least_words || count > chosen.most_words)
        throw wrong_use(std::string(chosen.name) +
                        (count < chosen.least_words ? " needs more words" : " takes fewer words"));
    const auto files_end = line.words.begin() + static_cast<std::ptrdiff_t>(std::min(chosen.files, count));
    const auto streams = std::count(line.words.begin(), files_end, standard_input);
    if (streams + (line.permissions == standard_input ? 1 : 0) > 1)
        throw wrong_use("standard input can be read once");
}

} // namespace

command_line read_command_line(std::span<const verb> verbs, const std::vector<std::string> &arguments) {
    command_line line;
    option_reader options(line);
    line.words = options.read(line, arguments);
    if (line.words.empty()) {
        if (!line.wants_help)
            throw wrong_use("which verb?");
        return line;
    }
    line.chosen = &find_verb(verbs, line.words.front());
    line.words.erase(line.words.begin());
    if (line.wants_help)
        return line;
    for (const std::string &option : options.given()) {
        if (!takes(*line.chosen, option))
            throw wrong_use(std::string(line.chosen->name) + " takes no " + option);
    }
    check_words(line);
    return line;
}

std::string help_of(std::span<const verb> verbs, const verb *chosen) {
    std::string text;
    for (const verb &each : verbs) {
        if (chosen != nullptr && chosen->name != each.name)
            continue;
        text += chosen != nullptr ? "usage: qzacl " : "  qzacl ";
        text.append(each.name).append(" ").append(each.usage).append("\n");
        text.append("      ").append(each.purpose).append("\n");
    }
    if (chosen == nullptr)
        text.insert(0, "usage:\n");
    return text + "\nAlso with every verb: --json, and --permissions SET for letters of a service's own.\n"
                  "FILE is a text, a compiled buffer, or \"-\" for standard input; of edits, a text. See "
                  "qzacl(1).\n";
}

} // namespace qzacl
