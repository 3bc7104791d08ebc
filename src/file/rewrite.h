// The life cycle that the structured files share: load on open, write anew on close.
#ifndef KORU_FILE_REWRITE_H
#define KORU_FILE_REWRITE_H

#include <string_view>

#include <koru/file.h>

#include "concurrency/cancellation.h"
#include "file/fileguard.h"
#include "file/filereader.h"

namespace Koru {

/// What takes the new content of a file.
class Sink {
public:
    virtual ~Sink() = default;
    virtual void write(std::string_view block) = 0;
};

/// The new content of a file. All memory that writing it takes is there before the old file is
/// touched.
class Content {
public:
    virtual ~Content() = default;

    /// Writes all of it, block by block and in order, as often as it is asked for.
    virtual void writeTo(Sink& sink) const = 0;
};

/// Opens the file, discards what was held in memory and calls `load(reader)` if the mode says so. A
/// cancellation leaves the mode 0: the destructor, which the same unwinding may call next, would
/// write what was loaded so far over the file.
template <class Discard, class Load>
void openAndLoad(File& file, unsigned long mode, Discard discard, Load load) {
    FileGuard const guard(file);
    undoIfCancelled(
        [&] {
            file.File::open(mode);
            discard();
            if ((file.getMode() & File::READ) == 0) return;
            FileReader reader(file);
            load(reader);
        },
        [&file] { file.File::setMode(0); });
}

/// Deletes the file and writes it anew with the mode of now; it is open afterwards.
/// @throws std::runtime_error "failed to write to file", and what File::open and close throw
void rewrite(File& file, Content const& content);

/// Writes the file anew if the mode says so, then discards what was held in memory and closes.
/// `prepare` gives the content, ready to be written, before the old file is touched: what fails for
/// want of memory fails while the old file is still there. A cancelled thread ends before or after
/// this, but not between the old file and the new one, nor between that and the empty memory.
template <class Prepare, class Discard>
void writeBackAndClose(File& file, Prepare prepare, Discard discard) {
    FileGuard const guard(file);
    CancellationOff const cancellationOff;
    if ((file.getMode() & File::WRITE) != 0) {
        auto const content = prepare();
        rewrite(file, content);
    }
    discard();
    file.File::close();
}

} // namespace Koru

#endif
