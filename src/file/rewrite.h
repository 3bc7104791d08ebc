// The life cycle that the structured files share: load on open, rewrite on close.
#ifndef KORU_FILE_REWRITE_H
#define KORU_FILE_REWRITE_H

#include <string_view>

#include <koru/file.h>

#include "concurrency/cancellation.h"
#include "file/fileguard.h"
#include "file/filereader.h"

namespace Koru {

/// Takes the new content of a file.
class Sink {
public:
    virtual ~Sink() = default;
    virtual void write(std::string_view block) = 0;
};

/// The new content of a file. It has all the memory that it needs before the old file is touched.
class Content {
public:
    virtual ~Content() = default;

    /// Writes all of the content, block by block. May be called again.
    virtual void writeTo(Sink& sink) const = 0;
};

/// Opens the file, discards what was held in memory and calls `load(reader)` if the mode has READ.
/// A cancellation sets the mode to 0: the same unwinding may call the destructor next, which must
/// not write half a file over the whole one.
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

/// Deletes the file and writes the content to a new one, which is open afterwards in the same mode.
/// @throws std::runtime_error "failed to write to file", and what File::open and close throw
void rewrite(File& file, Content const& content);

/// Rewrites the file if the mode has WRITE, then discards what was held in memory and closes.
/// `prepare` returns the content ready to be written, so if memory is short, it fails while the old
/// file is still there. A thread is cancelled before all of this or after it, never in between.
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
