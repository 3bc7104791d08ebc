// The program `koru`: what it understands on the command line, and its exit codes.
#include <koru/version.h>

#include <CLI/CLI.hpp>

#include <iostream>
#include <optional>
#include <string>

#include "commands.h"

namespace tool {

namespace {

using Command = void (*)(Family const&, Arguments const&);

char const* const EXIT_CODES = "Exit codes: 0 done; 1 not found, or lint has found something;\n"
                               "2 wrong arguments, or text that the file would not give back;\n"
                               "3 a file could not be read or written.";

/// What the program understands. The callbacks carry the commands out while it is parsed.
class CommandLine {
public:
    CommandLine() {
        app_.require_subcommand(1);
        app_.set_version_flag("--version", "koru " KORU_VERSION_STRING, "Show the version");
        app_.set_help_flag("-h,--help", "Show this help");
        app_.get_formatter()->label("REQUIRED", "");
        app_.get_formatter()->label("TEXT", "");
        app_.footer(EXIT_CODES);
        addFamily(SETTINGS, "Settings files with sections");
        addFamily(PROPERTIES, "Settings files without sections");
        addFamily(RECORDS, "Record files; their data are shown as hexadecimal digits");
        addUuid();
        addPath();
    }

    int parse(int argc, char** argv) {
        try {
            app_.parse(argc, argv);
            return DONE;
        } catch (CLI::RuntimeError const& e) { // the answer of `lint`
            return e.get_exit_code();
        } catch (CLI::Success const& e) { // --help and --version
            return app_.exit(e);
        } catch (CLI::ParseError const& e) {
            throw Failure(REFUSED, std::string(e.what()) + " (koru --help tells more)");
        }
    }

private:
    CLI::App* add(CLI::App* parent, Family const& family, char const* name, char const* what,
                  Command command) {
        CLI::App* const sub = parent->add_subcommand(name, what);
        sub->add_option("FILE", arguments_.file, "The file")->required();
        sub->callback([this, &family, command] {
            about(arguments_.file, [&] { command(family, arguments_); });
        });
        return sub;
    }

    /// An argument that may be empty, which is another thing than none.
    static CLI::Option* addText(CLI::App* sub, char const* name, std::optional<std::string>& text,
                                char const* what) {
        return sub->add_option_function<std::string>(
            name, [&text](std::string const& given) { text = given; }, what);
    }

    CLI::Option* addSection(CLI::App* sub) {
        return addText(sub, "SECTION", arguments_.section, "The section");
    }

    CLI::Option* addKey(Family const& family, CLI::App* sub) {
        if (family.hasSections) addSection(sub)->required();
        return addText(sub, "KEY", arguments_.key, "The key");
    }

    void addRaw(Family const& family, CLI::App* sub) {
        if (family.text != &family)
            sub->add_flag("--raw", arguments_.isRaw, "The data are bytes as they are, not digits");
    }

    void addFormat(CLI::App* sub) {
        sub->add_option("--format", arguments_.format, "In lines of text (the default) or of JSON")
            ->check(CLI::IsMember({"text", "json"}));
    }

    void addForce(CLI::App* sub) {
        sub->add_flag("--force", arguments_.options.mayLose,
                      "Go on although lines are lost of which lint tells");
    }

    void addFamily(Family const& family, char const* what) {
        CLI::App* const parent = app_.add_subcommand(family.name, what);
        parent->require_subcommand(1);
        addList(family, parent);
        addGet(family, parent);
        addSet(family, parent);
        addRemove(family, parent);
        addImport(family, parent);
        addFormat(add(parent, family, "export", "Write everything to standard output", exportTo));
        if (family.text == &family) addLint(family, parent);
    }

    void addList(Family const& family, CLI::App* parent) {
        CLI::App* const sub = add(
            parent, family, "list",
            family.hasSections ? "List the sections, or the keys of one" : "List the keys", list);
        if (family.hasSections) addSection(sub);
        addFormat(sub);
    }

    void addGet(Family const& family, CLI::App* parent) {
        CLI::App* const sub = add(parent, family, "get", "Show a value", get);
        addKey(family, sub)->required();
        addRaw(family, sub);
    }

    void addSet(Family const& family, CLI::App* parent) {
        CLI::App* const sub = add(parent, family, "set", "Set a value, in a new file too", set);
        addKey(family, sub)->required();
        addText(sub, "VALUE", arguments_.value, "The value; without it, standard input");
        addRaw(family, sub);
        if (family.text == &family) addForce(sub);
    }

    void addRemove(Family const& family, CLI::App* parent) {
        CLI::App* const sub =
            add(parent, family, "remove",
                family.hasSections ? "Remove a key, or a whole section" : "Remove a key", remove);
        addKey(family, sub)->required(!family.hasSections);
        if (family.text == &family) addForce(sub);
    }

    void addImport(Family const& family, CLI::App* parent) {
        CLI::App* const sub =
            add(parent, family, "import", "Set what an export has written", importFrom);
        sub->add_option("INPUT", arguments_.input, "The export; without it, standard input");
        sub->add_flag("--replace", arguments_.options.isToReplace,
                      "Remove what the file has before");
        addFormat(sub);
        addForce(sub);
    }

    void addLint(Family const& family, CLI::App* parent) {
        CLI::App* const sub = parent->add_subcommand("lint", "Tell what is dangerous in files");
        sub->add_option("FILE", arguments_.files, "The files")->required();
        sub->callback([this, &family] {
            if (!lintFiles(family, arguments_)) throw CLI::RuntimeError(NOT_FOUND);
        });
    }

    void addUuid() {
        CLI::App* const sub = app_.add_subcommand("uuid", "Make an identifier, or check one");
        addText(sub, "IDENTIFIER", arguments_.value,
                "The one to check and to show in small letters");
        sub->callback([this] { uuid(arguments_); });
    }

    void addPath() {
        CLI::App* const sub = app_.add_subcommand("path", "Show which file the library means");
        sub->add_option("PATH", arguments_.file, "The path that a program gives it")->required();
        sub->add_option("--program", arguments_.program, "That program; without it, this one")
            ->type_name("PROGRAM");
        sub->callback([this] { about(arguments_.file, [&] { path(arguments_); }); });
    }

    CLI::App app_{"Reads and changes files of the Koru library.", "koru"};
    Arguments arguments_;
};

int _complain(Failure const& failure) {
    std::cerr << "koru: " << failure.file() << (failure.file().empty() ? "" : ": ")
              << failure.what() << '\n';
    return failure.exitCode();
}

} // namespace

int run(int argc, char** argv) {
    std::ios::sync_with_stdio(false); // so that standard input tells when it cannot be read
    try {
        return CommandLine().parse(argc, argv);
    } catch (...) {
        return _complain(currentFailure(""));
    }
}

} // namespace tool

int main(int argc, char** argv) { return tool::run(argc, argv); }
