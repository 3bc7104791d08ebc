/// @file
/// Loading shared libraries at run time.
#ifndef KORU_DYNAMICLIBRARY_H
#define KORU_DYNAMICLIBRARY_H

#include <string>

#include <koru/export.h>

namespace Koru {

/// A shared library that is loaded on request (`dlopen`, POSIX) and unloaded at the latest when the
/// object is destroyed. Each object owns at most one handle. The object has no lock: threads that
/// share one guard it. Nothing is thrown, apart from `std::bad_alloc`; why loading failed is not
/// kept, but `dlerror` tells right after a failed `load`.
class KORU_EXPORT DynamicLibrary {
public:
    /// Not loaded, with an empty name.
    DynamicLibrary();

    /// Not loaded. The name is given to the loader as UTF-8 and otherwise unchanged: one without a
    /// slash is searched for as the loader does, a relative path counts from the working directory.
    /// The loader searches for libkoru's sake: the program's DT_RUNPATH is not used (DT_RPATH and
    /// LD_LIBRARY_PATH are), and $ORIGIN is the folder of libkoru.
    DynamicLibrary(std::wstring const& fileName);

    /// Copies the name and, if the other is loaded, loads the library again under a handle of its
    /// own.
    DynamicLibrary(DynamicLibrary const& other);

    /// Unloads what is loaded, then copies as the copy constructor does. Nothing happens when an
    /// object is assigned to itself.
    DynamicLibrary& operator=(DynamicLibrary const& other);

    /// Unloads the library.
    virtual ~DynamicLibrary();

    /// Loads the library, binding its functions when they are first called and keeping its symbols
    /// from other libraries; nothing happens when it is loaded.
    /// @return whether it is loaded now
    virtual bool load();

    /// Gives the handle back, if there is one; symbols looked up before are not to be used any
    /// more.
    /// @return true
    virtual bool unload();

    virtual bool isLoaded() const;

    /// The loader's handle, null when not loaded. It stays the object's own.
    void* getHandle() const;

    std::wstring getFileName() const;

    /// The address of a symbol, valid until the library is unloaded; null when it is missing or
    /// nothing is loaded.
    void* getSymbol(std::wstring const& name) const;

private:
    std::wstring fileName_;
    void* handle_;
};

} // namespace Koru

#endif
