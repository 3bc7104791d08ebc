#include <koru/dynamiclibrary.h>

#include <dlfcn.h>

#include <koru/string.h>

#include "text/convert.h"

namespace Koru {

DynamicLibrary::DynamicLibrary() : handle_(nullptr) {}

DynamicLibrary::DynamicLibrary(std::wstring const& fileName)
    : fileName_(wideString(fileName.data(), fileName.size())), handle_(nullptr) {}

DynamicLibrary::DynamicLibrary(DynamicLibrary const& other)
    : fileName_(other.fileName_), handle_(nullptr) {
    if (other.isLoaded()) DynamicLibrary::load();
}

DynamicLibrary& DynamicLibrary::operator=(DynamicLibrary const& other) {
    if (this == &other) return *this;
    if (isLoaded()) unload();
    fileName_ = other.fileName_;
    if (other.isLoaded()) load();
    return *this;
}

DynamicLibrary::~DynamicLibrary() { DynamicLibrary::unload(); }

bool DynamicLibrary::load() {
    if (handle_ == nullptr) handle_ = ::dlopen(make_string(fileName_).c_str(), RTLD_LAZY);
    return handle_ != nullptr;
}

bool DynamicLibrary::unload() {
    // Intended: the result does not matter.
    if (handle_ != nullptr) static_cast<void>(::dlclose(handle_));
    handle_ = nullptr;
    return true;
}

bool DynamicLibrary::isLoaded() const { return handle_ != nullptr; }

void* DynamicLibrary::getHandle() const { return handle_; }

std::wstring DynamicLibrary::getFileName() const { return fileName_; }

void* DynamicLibrary::getSymbol(std::wstring const& name) const {
    return handle_ == nullptr ? nullptr : ::dlsym(handle_, make_string(name).c_str());
}

} // namespace Koru
