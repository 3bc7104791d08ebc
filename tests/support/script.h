// Scripts: what is done to an object and what holds of it then, as words in their order.
#ifndef KORU_TESTS_SCRIPT_H
#define KORU_TESTS_SCRIPT_H

#include <doctest/doctest.h>

#include <map>
#include <sstream>
#include <string>

namespace test {

/// What each word does to the object or checks of it.
template <class Object>
using Words = std::map<std::string, void (*)(Object&)>;

template <class Object>
void follow(Object& object, Words<Object> const& words, std::string const& script) {
    std::istringstream in(script);
    int number = 0;
    for (std::string word; in >> word;) {
        INFO("word ", ++number, " of the script: ", word);
        words.at(word)(object);
    }
}

} // namespace test

#endif
