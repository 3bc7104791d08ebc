// The text of a settings file, from its table.
#ifndef KORU_SETTINGS_RENDER_H
#define KORU_SETTINGS_RENDER_H

#include "file/rewrite.h"
#include "settings/settingstable.h"

namespace Koru {

/// One line for each entry, in the order of the table: key, "=" and value.
enum class Headers {
    NONE,
    OF_SECTIONS ///< before the first entry of each run in one section: "[", its name and "]"
};

Content render(SettingsTable const& table, Headers headers);

} // namespace Koru

#endif
