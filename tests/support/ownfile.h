// A file object with its file.
#ifndef KORU_TESTS_OWNFILE_H
#define KORU_TESTS_OWNFILE_H

#include <string>

#include "support/tempdir.h"

namespace test {

/// A file object in a place of its own. Given a mode, it is open; given bytes, they are in
/// the file.
template <class File>
class OwnFile : public HasPlace, public File {
public:
    OwnFile() : File(place.path()) {}
    template <class Mode>
    explicit OwnFile(Mode mode) : OwnFile() {
        this->open(mode);
    }
    template <class Mode>
    OwnFile(std::string const& bytes, Mode mode) : OwnFile() {
        place.write(bytes);
        this->open(mode);
    }

    std::string bytes() const { return place.bytes(); }
};

} // namespace test

#endif
