#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "platform/image_service.h"
#include "platform/value.h"

namespace zt::contacts {

// The picture of a contact as the player wants it: a JPEG of at most 20480 bytes as it is;
// a larger JPEG scaled to fit in 256 x 256 pixels and re-encoded, unless that makes it
// bigger; any other format always converted to JPEG.
class ContactPhotoPreparation {
 public:
  using ImageServiceMaker = std::function<
      std::variant<std::unique_ptr<platform::ImageService>, platform::ImageServiceFailure>()>;

  // The process's preparation over libvips: its rendering state is made at the first
  // picture that needs it and kept until the process ends.
  static ContactPhotoPreparation& shared();

  // The maker is asked for the image service when a picture first needs one, and again at
  // the next picture after it failed.
  explicit ContactPhotoPreparation(ImageServiceMaker maker);

  // The bytes to embed for the contact's image, or none.
  std::optional<platform::Data> photoForContact(const platform::Dictionary& contact);
  // Appends the PHOTO property with the bytes of photoForContact, or nothing.
  void appendPhoto(std::string& card, const platform::Dictionary& contact);

  static constexpr std::size_t kLargestEmbeddedJPEG = 20480;
  static constexpr double kSide = 256.0;

 private:
  platform::ImageService* imageService();

  ImageServiceMaker maker_;
  std::unique_ptr<platform::ImageService> service_;
};

}  // namespace zt::contacts
