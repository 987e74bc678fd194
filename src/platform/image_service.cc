// makeImageService(): the libvips service lives in a module of its own, loaded at the first
// picture to convert, so that a run converting none never loads libvips and the hundred
// libraries it brings.
#include "platform/image_service.h"

#include <dlfcn.h>

#include <array>
#include <filesystem>
#include <system_error>

namespace zt::platform {

namespace {

using MakeService = ImageService* (*)(ImageServiceFailure*);

constexpr const char* kModuleName = ZT_VIPS_MODULE_NAME;

// Where the module is looked for: beside an installed program (<prefix>/lib/zetosynctool),
// then where the build put it. Both are fixed by the program's own location or the build; no
// search path from the environment is used.
std::array<std::filesystem::path, 2> modulePaths() {
  std::error_code error;
  const std::filesystem::path program = std::filesystem::read_symlink("/proc/self/exe", error);
  std::filesystem::path installed;
  if (!error)
    installed = program.parent_path().parent_path() / ZT_VIPS_MODULE_INSTALL_DIR / kModuleName;
  return {installed, std::filesystem::path(ZT_VIPS_MODULE_BUILD_DIR) / kModuleName};
}

// The module's entry, loaded once per process; null when the module cannot be loaded.
MakeService loadModule() {
  static const MakeService make = []() -> MakeService {
    for (const std::filesystem::path& path : modulePaths()) {
      if (path.empty()) continue;
      // Never unloaded: libvips keeps threads and types for the life of the process.
      void* module = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
      if (!module) continue;
      if (auto* entry =
              reinterpret_cast<MakeService>(dlsym(module, "zt_make_vips_image_service"))) {
        return entry;
      }
    }
    return nullptr;
  }();
  return make;
}

}  // namespace

std::variant<std::unique_ptr<ImageService>, ImageServiceFailure> makeImageService() {
  const MakeService make = loadModule();
  if (!make) return ImageServiceFailure::NoRenderingContext;
  ImageServiceFailure failure = ImageServiceFailure::NoRenderingContext;
  ImageService* service = make(&failure);
  if (!service) return failure;
  return std::unique_ptr<ImageService>(service);
}

std::string_view imageServiceIdentity() {
  return "libvips " ZT_VIPS_VERSION;
}

}  // namespace zt::platform
