// The text of a settings file, from its table.
#ifndef KORU_SETTINGS_RENDER_H
#define KORU_SETTINGS_RENDER_H

#include <cstddef>
#include <memory>
#include <string_view>
#include <utility>

#include "file/rewrite.h"
#include "settings/settingstable.h"

namespace Koru {

/// What the text has besides a line for each entry: key, "=" and value.
enum class Headers {
    NONE,
    OF_SECTIONS ///< a line "[", name, "]" before each run of entries in one section
};

/// The whole file as one block.
class RenderedText : public Content {
public:
    RenderedText(std::unique_ptr<char[]> bytes, std::size_t size)
        : bytes_(std::move(bytes)), size_(size) {}

    void writeTo(Sink& sink) const override { sink.write(std::string_view(bytes_.get(), size_)); }

private:
    std::unique_ptr<char[]> bytes_;
    std::size_t size_;
};

RenderedText render(SettingsTable const& table, Headers headers);

} // namespace Koru

#endif
