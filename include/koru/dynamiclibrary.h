/// @file
/// Loading shared libraries at run time.
#ifndef KORU_DYNAMICLIBRARY_H
#define KORU_DYNAMICLIBRARY_H

#include <string>

#include <koru/export.h>

namespace Koru {

/// A shared library that is loaded on request (`dlopen`, POSIX) and unloaded at the latest when the
/// object is destroyed. Each object owns at most one handle. It has no lock: threads that share an
/// object guard it themselves. The operations throw nothing but `std::bad_alloc`. The object does
/// not keep the reason for a failure; `dlerror` tells it right after a failed `load`.
class KORU_EXPORT DynamicLibrary {
public:
    /// Not loaded, with an empty name.
    DynamicLibrary();

    /// Not loaded. The loader gets the name as UTF-8, otherwise unchanged: it searches for a name
    /// without a slash, and a relative path starts at the working directory. It searches on behalf
    /// of libkoru: it uses LD_LIBRARY_PATH and the program's DT_RPATH, but not its DT_RUNPATH, and
    /// $ORIGIN is the folder of libkoru.
    DynamicLibrary(std::wstring const& fileName);

    /// Copies the name and, if the other object is loaded, loads the library again under a handle
    /// of its own. Does not call an override of `load`.
    DynamicLibrary(DynamicLibrary const& other);

    /// Calls `unload` if this object is loaded, copies the name and, if the other object is loaded,
    /// calls `load`. Does nothing when an object is assigned to itself.
    DynamicLibrary& operator=(DynamicLibrary const& other);

    /// Unloads the library.
    virtual ~DynamicLibrary();

    /// Loads the library, unless it is already loaded. Its functions are bound when they are first
    /// called, and other libraries do not see its symbols.
    /// @return whether it is loaded now
    virtual bool load();

    /// Gives the handle back, if there is one. Symbols looked up before are no longer valid.
    /// @return true
    virtual bool unload();

    /// Whether the object has a handle.
    virtual bool isLoaded() const;

    /// The loader's handle, null when not loaded. The object still owns it.
    void* getHandle() const;

    /// The name as it was given.
    std::wstring getFileName() const;

    /// The address of a symbol, valid until the library is unloaded; null when the symbol is
    /// missing or nothing is loaded.
    void* getSymbol(std::wstring const& name) const;

private:
    std::wstring fileName_;
    void* handle_;
};

} // namespace Koru

#endif
