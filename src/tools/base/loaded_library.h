// SPDX-License-Identifier: Apache-2.0
// A library that is opened when it is needed first: linked, it would take its part of every start.
#pragma once

#include <dlfcn.h>

#include <cstring>
#include <string>
#include <utility>

#include "base/failure.h"

namespace tool {

// It stays open to the end of the process.
class LoadedLibrary {
 public:
  // problem begins the message when a function is missing.
  LoadedLibrary(const char* name, std::string problem)
      : handle_(dlopen(name, RTLD_NOW | RTLD_LOCAL)), problem_(std::move(problem)) {}

  // Throws Failure (kInternal) when the library or the function is missing.
  template <typename Function>
  void resolve(const char* name, Function& function) const {
    void* address = handle_ != nullptr ? dlsym(handle_, name) : nullptr;
    if (address == nullptr) throw Failure(kInternal, problem_ + ": " + dlerror());
    memcpy(&function, &address, sizeof function);
  }

 private:
  void* handle_;
  std::string problem_;
};

}  // namespace tool
