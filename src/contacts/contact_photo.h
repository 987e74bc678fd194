#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <unordered_map>
#include <variant>

#include "contacts/photo_cache.h"
#include "platform/image_service.h"
#include "platform/value.h"

namespace zt::contacts {

// The picture of a contact as the player wants it: a JPEG of at most 20480 bytes as it is;
// a larger JPEG scaled to fit in 256 x 256 pixels and re-encoded, unless that makes it
// bigger; any other format always converted to JPEG.
//
// Conversions are kept in an optional PhotoCache between runs, and prefetch() converts the
// pictures of the cards to come on several threads. Either way, each card logs, in card
// order, the very lines that converting its picture there and then would log.
class ContactPhotoPreparation {
 public:
  using ImageServiceMaker = std::function<
      std::variant<std::unique_ptr<platform::ImageService>, platform::ImageServiceFailure>()>;

  // How many pictures prefetch() converts at once.
  enum class Threads { One, AllCores };

  // The process's preparation over libvips, with the user's photo cache and converting on all
  // cores: its rendering state is made at the first picture that needs converting and kept
  // until the process ends.
  static ContactPhotoPreparation& shared();

  // The maker is asked for the image service when a picture first needs converting, and again
  // at the next picture after it failed. The image service must allow one operation per
  // thread at once with Threads::AllCores.
  explicit ContactPhotoPreparation(ImageServiceMaker maker,
                                   std::unique_ptr<PhotoCache> cache = nullptr,
                                   Threads threads = Threads::One);

  // Converts, or finds in the cache, the pictures of cards about to be written, without
  // logging; the cards then take their photos from here. Each picture's bytes must stay alive
  // and unchanged until its card is written. May be called once per batch of cards. With
  // `origins` (one per picture), the cache finds the pictures by where they come from
  // instead of reading all their bytes.
  void prefetch(std::span<const platform::Data* const> pictures,
                std::span<const PictureOrigin> origins = {});
  // Ends a run that wrote every card: forgets what prefetch() kept and removes the cache
  // entries that no picture used since the last end.
  void finishRun();

  // The bytes to embed for the contact's image, or none.
  std::optional<platform::Data> photoForContact(const platform::Dictionary& contact);
  // Appends the PHOTO property with the bytes of photoForContact, or nothing.
  void appendPhoto(std::string& card, const platform::Dictionary& contact);

  static constexpr std::size_t kLargestEmbeddedJPEG = 20480;
  static constexpr double kSide = 256.0;

 private:
  enum class Logging { Silent, Logged };
  // The image service, made when missing; none (and the failure logged, or kept for the next
  // card when silent) when it cannot be made.
  platform::ImageService* imageService(Logging logging);
  // The conversion of a picture that needs one, from prefetch(), the cache, or made now.
  std::optional<PhotoConversion> conversionFor(const platform::Data& picture);

  ImageServiceMaker maker_;
  std::unique_ptr<PhotoCache> cache_;
  Threads threads_;
  std::mutex serviceMutex_;
  std::unique_ptr<platform::ImageService> service_;
  // A failure to make the service met by prefetch(), logged by the next card that needs it.
  std::optional<platform::ImageServiceFailure> unloggedFailure_;
  // Whether "Creating Vuro context" has been logged and answered with a service.
  bool serviceAnnounced_ = false;
  // What prefetch() found, by the address of the picture's bytes, with their size: a card
  // left unwritten by a cancelled run never hands its conversion to other bytes of another
  // size at the same address.
  struct Prefetched {
    std::size_t size = 0;
    PhotoConversion conversion;
  };
  std::unordered_map<const std::uint8_t*, Prefetched> prefetched_;
};

}  // namespace zt::contacts
