// The game of the two settings files: calls taken from the input, on the library's file and on its
// model, from any bytes at the start to the bytes at the end.
#ifndef KORU_FUZZ_SETTINGSPLAY_H
#define KORU_FUZZ_SETTINGSPLAY_H

#include <cstddef>
#include <cstdint>

#include <koru/file.h>

#include "check.h"
#include "input.h"
#include "memoryfile.h"

namespace fuzz {

/// Does one call of the life cycle on both.
template <class Settings, class Model>
void moveOn(Input& input, Settings& file, Model& model) {
    unsigned long const mode = 1 + input.below(3);
    switch (input.below(4)) {
    case 0:
        if (model.isOpen()) break;
        file.open(mode);
        model.open(mode);
        break;
    case 1:
        file.close();
        model.close();
        break;
    case 2:
        file.setMode(mode);
        model.setMode(mode);
        break;
    default:
        file.synchronize();
        model.synchronize();
        break;
    }
}

/// Plays the input. `change` does one call on both that changes what they hold, and compares them.
template <class Settings, class Model, class Change>
void playSettings(std::uint8_t const* data, std::size_t size, Change change) {
    static MemoryFile const memory;
    unsigned long const both = Koru::File::READ | Koru::File::WRITE;
    Input input(data, size);
    Model model;
    model.exists = true;
    for (unsigned pieces = input.below(8); pieces > 0; --pieces) model.bytes += input.bytes();
    memory.write(model.bytes);
    {
        Settings file(memory.path());
        file.open(both);
        model.open(both);
        while (!input.isAtEnd()) {
            if (input.below(4) == 0)
                moveOn(input, file, model);
            else
                change(input, file, model);
            KORU_CHECK(file.is_open() == model.isOpen() && file.getMode() == model.getMode());
        }
        // The destructor closes the file, and writes one that is closed too if the mode says so.
        model.close();
    }
    KORU_CHECK(memory.bytes() == model.bytes);
}

} // namespace fuzz

#endif
