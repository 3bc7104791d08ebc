#include "failure.h"

#include <cerrno>
#include <cstring>
#include <new>
#include <system_error>

namespace tool {

void failBySystem(std::string const& attempt) {
    throw Failure(FAILED, attempt + ": " + std::strerror(errno));
}

Failure currentFailure(std::string const& file) {
    try {
        throw;
    } catch (Failure const& e) {
        return e.file().empty() ? Failure(e.exitCode(), e.what(), file) : e;
    } catch (std::system_error const& e) { // its what() names the function that has failed
        return {FAILED, e.code().message(), file};
    } catch (std::bad_alloc const&) {
        return {FAILED, "not enough memory", file};
    } catch (std::exception const& e) {
        return {FAILED, e.what(), file};
    }
}

} // namespace tool
