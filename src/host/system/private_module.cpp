#include "host/system/private_module.h"

#include <dlfcn.h>
#include <link.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <span>
#include <utility>

#include "base/files/file.h"

namespace tally {
namespace {

// Whether everybody who can write the module, or replace it in its folder, can write the program.
bool isAsSafe(const struct stat& module, const struct stat& program) {
  const bool ofOwner = module.st_uid == 0 || module.st_uid == program.st_uid;
  const bool ofGroup = (module.st_mode & S_IWGRP) == 0 ||
                       ((program.st_mode & S_IWGRP) != 0 && module.st_gid == program.st_gid);
  const bool ofOthers = (module.st_mode & S_IWOTH) == 0 || (program.st_mode & S_IWOTH) != 0;
  return ofOwner && ofGroup && ofOthers;
}

// Symbol tables and relocations, the first and read-only part of every library, are of use to the
// dynamic linker alone: 1.4 MiB that this process no longer counts. What is read again after all
// comes back from the file.
int releaseLinkerPages(struct dl_phdr_info* library, std::size_t, void*) {
  const auto page = static_cast<std::uintptr_t>(::sysconf(_SC_PAGESIZE));
  for (const ElfW(Phdr) & part : std::span(library->dlpi_phdr, library->dlpi_phnum)) {
    if (part.p_type != PT_LOAD) continue;
    const std::uintptr_t begin = (library->dlpi_addr + part.p_vaddr) / page * page;
    if (part.p_flags == PF_R && part.p_offset == 0) {
      ::madvise(reinterpret_cast<void*>(begin), part.p_memsz, MADV_DONTNEED);
    }
    break;
  }
  return 0;
}

}  // namespace

Result<void*> functionOfModule(const std::string& program, const std::string& module,
                               const char* function) {
  const std::string folder = program.substr(0, program.rfind('/'));
  const std::string ofModules = folder.substr(0, folder.rfind('/')) + "/lib/tallyrun";
  const std::string path = ofModules + "/" + module;
  struct stat ofProgram {
  }, ofFolder{}, ofModule{};
  if (::stat(program.c_str(), &ofProgram) != 0) return systemError("cannot examine", program);
  if (::stat(path.c_str(), &ofModule) != 0) return systemError("cannot examine", path);
  if (::stat(ofModules.c_str(), &ofFolder) != 0) return systemError("cannot examine", ofModules);
  if (!S_ISREG(ofModule.st_mode)) return Error{path + " is not a file"};
  for (const auto& [status, name] : {std::pair(&ofModule, &path), {&ofFolder, &ofModules}}) {
    if (isAsSafe(*status, ofProgram)) continue;
    return Error{*name + " can be written by others than " + program};
  }
  // A path with a slash is looked for nowhere else.
  void* const loaded = ::dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  void* const found = loaded != nullptr ? ::dlsym(loaded, function) : nullptr;
  if (found == nullptr) return Error{std::string("cannot load ") + ::dlerror()};
  ::dl_iterate_phdr(releaseLinkerPages, nullptr);
  return found;
}

}  // namespace tally
