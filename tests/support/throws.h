// Exceptions, checked for their exact type and full message.
#ifndef KORU_TESTS_THROWS_H
#define KORU_TESTS_THROWS_H

#include <exception>
#include <string>
#include <typeinfo>

namespace test {

/// What the callable throws: "<nothing>", the message when its type is exactly `Exception`, or
/// another type's name and message. So `CHECK(messageOf<std::runtime_error>([&] { ... }) == "...")`
/// tests type and message at once and shows what came instead.
template <class Exception, class Callable>
std::string messageOf(Callable callable) {
    try {
        callable();
    } catch (std::exception const& e) {
        if (typeid(e) == typeid(Exception)) return e.what();
        return std::string("<") + typeid(e).name() + "> " + e.what();
    } catch (...) {
        return "<an exception of another kind>";
    }
    return "<nothing>";
}

} // namespace test

#endif
