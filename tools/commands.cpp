#include "commands.h"

#include <koru/string.h>

#include <algorithm>
#include <iostream>

#include "lint.h"
#include "print.h"
#include "text.h"

namespace tool {

namespace {

std::string _described(Family const& family, Entry const& name) {
    std::string const section =
        family.hasSections ? " in section " + quoted(name.section) : std::string();
    return std::string("no ") + family.item + " " + quoted(name.key) + section;
}

Entry const& _find(Family const& family, std::vector<Entry> const& entries, Entry const& name) {
    auto const found = std::find_if(entries.begin(), entries.end(),
                                    [&](Entry const& entry) { return haveSameName(entry, name); });
    if (found == entries.end()) throw Failure(NOT_FOUND, _described(family, name));
    return *found;
}

/// The entries of the section.
std::vector<Entry> _ofSection(std::vector<Entry> entries, std::string const& section) {
    entries.erase(std::remove_if(entries.begin(), entries.end(),
                                 [&](Entry const& entry) {
                                     return Koru::compare(entry.section, section) != 0;
                                 }),
                  entries.end());
    if (entries.empty()) throw Failure(NOT_FOUND, "no section " + quoted(section));
    return entries;
}

std::vector<Entry> _sections(std::vector<Entry> entries) {
    for (Entry& entry : entries) entry = {entry.section, "", ""};
    return firstOfEach(entries);
}

std::string _bytes(std::string const& digits) {
    std::vector<unsigned char> const bytes = unhex(digits);
    return {bytes.begin(), bytes.end()};
}

std::string _digits(std::string const& bytes) { return hex({bytes.begin(), bytes.end()}); }

Format _format(Arguments const& arguments) {
    return arguments.format == "json" ? Format::JSON : Format::TEXT;
}

Entry _name(Arguments const& arguments) {
    return {arguments.section.value_or(""), arguments.key.value_or(""), ""};
}

Options _creating(Arguments const& arguments) {
    Options options = arguments.options;
    options.mayCreate = true;
    return options;
}

/// A value that is not among the arguments comes from standard input, as a line.
std::string _value(Arguments const& arguments) {
    if (arguments.value) return arguments.isRaw ? _digits(*arguments.value) : *arguments.value;
    std::string const input = readAll("-");
    return arguments.isRaw ? _digits(input) : input.substr(0, input.find_last_not_of('\n') + 1);
}

} // namespace

void print(std::string const& text) {
    std::cout << text << std::flush;
    if (!std::cout) about("standard output", [] { failBySystem("cannot write"); });
}

void list(Family const& family, Arguments const& arguments) {
    std::vector<Entry> entries = read(family, arguments.file);
    if (arguments.section)
        entries = _ofSection(entries, *arguments.section);
    else if (family.hasSections)
        entries = _sections(entries);
    print(listed(entries, _format(arguments)));
}

void get(Family const& family, Arguments const& arguments) {
    std::vector<Entry> const entries = read(family, arguments.file);
    std::string const& value = _find(family, entries, _name(arguments)).value;
    print(arguments.isRaw ? _bytes(value) : value + "\n");
}

void set(Family const& family, Arguments const& arguments) {
    Entry entry = _name(arguments);
    entry.value = _value(arguments);
    family.check(entry);
    change(family, arguments.file, _creating(arguments), [&](Table& table) { table.set(entry); });
}

void remove(Family const& family, Arguments const& arguments) {
    Entry const name = _name(arguments);
    change(family, arguments.file, arguments.options, [&](Table& table) {
        if (arguments.key)
            (void)_find(family, table.entries(), name);
        else
            (void)_ofSection(table.entries(), name.section);
        table.remove(name);
    });
}

void importFrom(Family const& family, Arguments const& arguments) {
    std::vector<Entry> const entries = about(arguments.input, [&] {
        Format const format = _format(arguments);
        std::string const bytes = readAll(arguments.input);
        if (format == Format::TEXT && !arguments.options.mayLose)
            refuseLoss(bytes, family.text->hasSections);
        std::vector<Entry> parsed = parse(family, bytes, format);
        for (Entry const& entry : parsed) family.check(entry);
        return parsed;
    });
    change(family, arguments.file, _creating(arguments), [&](Table& table) {
        for (Entry const& entry : entries) table.set(entry);
    });
}

void exportTo(Family const& family, Arguments const& arguments) {
    print(exported(family, read(family, arguments.file), _format(arguments)));
}

} // namespace tool
