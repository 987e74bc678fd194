#include "contacts/contact_photo.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "contacts/vcard_text.h"
#include "platform/log.h"
#include "tessel/schema.h"

namespace zt::contacts {

using platform::Log;

namespace {

// The text of a name attribute as log lines print it, "(null)" when there is none.
std::string nameText(const platform::Dictionary& contact, std::string_view key) {
  const std::string* text = contact.stringAt(key);
  return text ? *text : "(null)";
}

std::string nameLabel(const platform::Dictionary& contact) {
  return Log::format("\"%@ %@\"",
                     {nameText(contact, tessel::TesselAttribute_Contacts_Contact_FirstName),
                      nameText(contact, tessel::TesselAttribute_Contacts_Contact_LastName)});
}

// Whether the picture goes through the image service: a JPEG over the threshold, or another
// format.
bool needsConversion(const platform::Data& picture) {
  if (picture.size() < 2) return false;
  const bool jpeg = picture[0] == 0xFF && picture[1] == 0xD8;
  return !jpeg || picture.size() > ContactPhotoPreparation::kLargestEmbeddedJPEG;
}

// Converts without logging; replay() logs what happened.
PhotoConversion convert(platform::ImageService& service, const platform::Data& picture) {
  using Outcome = PhotoConversion::Outcome;
  // The JPEG start-of-image marker is all that is looked at.
  const bool converted = !(picture[0] == 0xFF && picture[1] == 0xD8);
  PhotoConversion conversion;
  std::unique_ptr<platform::Image> image = service.decode(picture);
  conversion.extent = image ? image->extent() : platform::PixelSize{};
  const platform::PixelSize extent = conversion.extent;
  if (extent.width <= 0 || extent.height <= 0) {
    conversion.outcome = Outcome::Invalid;
    return conversion;
  }

  // The factor is kept in single precision, as the player's software always computed it.
  const auto side = ContactPhotoPreparation::kSide;
  const float factor = static_cast<float>(std::min(side / extent.width, side / extent.height));
  platform::PixelSize target = extent;
  std::unique_ptr<platform::Image> scaled;
  if (factor < 1.0f) {
    conversion.factor = factor;
    scaled = service.scale(*image, factor);
    if (!scaled) {
      conversion.outcome = Outcome::ScaleFailed;
      return conversion;
    }
    target = {std::max(1, static_cast<int>(std::lround(extent.width * double{factor}))),
              std::max(1, static_cast<int>(std::lround(extent.height * double{factor})))};
  }

  std::unique_ptr<platform::Image> bitmap = service.render(scaled ? *scaled : *image, target);
  if (!bitmap) {
    conversion.outcome = Outcome::RenderFailed;
    return conversion;
  }
  std::optional<platform::Data> reduced = service.encodeJPEG(*bitmap);
  if (!reduced) {
    conversion.outcome = Outcome::EncodeFailed;
    return conversion;
  }
  conversion.reducedSize = reduced->size();
  // A JPEG is only ever replaced by a smaller one; a converted picture is always replaced,
  // because the player reads nothing but JPEG.
  if (!converted && reduced->size() > picture.size()) {
    conversion.outcome = Outcome::Larger;
    return conversion;
  }
  conversion.outcome = Outcome::Reduced;
  conversion.reduced = std::move(*reduced);
  return conversion;
}

// Logs the lines of the conversion, as converting the picture there and then does, and
// answers the bytes to embed.
std::optional<platform::Data> replay(PhotoConversion conversion, const platform::Data& picture) {
  using Outcome = PhotoConversion::Outcome;
  if (conversion.outcome == Outcome::Invalid) {
    Log::debug("Image is invalid, ignoring");
    return std::nullopt;
  }
  if (conversion.factor < 1.0f) {
    Log::debug("Resizing to %ulx%ul (x%f)", 256, 256, double{conversion.factor});
  } else {
    Log::debug("Not resizing (keeping size %fx%f)", double{1.0} * conversion.extent.width,
               double{1.0} * conversion.extent.height);
  }
  switch (conversion.outcome) {
    case Outcome::Invalid:
      break;
    case Outcome::ScaleFailed:
    case Outcome::RenderFailed:
      Log::debug("Did not reduce image... using the one in truth");
      return picture;
    case Outcome::EncodeFailed:
      Log::always("Cannot create image destination");
      return std::nullopt;
    case Outcome::Larger:
      Log::debug("After reducing the image, size is %ul, so we better use the one in truth",
                 std::size_t{conversion.reducedSize});
      return picture;
    case Outcome::Reduced:
      Log::debug("After reducing/converting the image, size is %ul",
                 std::size_t{conversion.reducedSize});
      return std::move(conversion.reduced);
  }
  return std::nullopt;
}

void logServiceFailure(platform::ImageServiceFailure failure) {
  if (failure == platform::ImageServiceFailure::OutOfMemory) {
    Log::always("Unable to allocate memory");
  } else {
    Log::always("Unable to create Dravo context");
  }
}

}  // namespace

ContactPhotoPreparation& ContactPhotoPreparation::shared() {
  // Never destroyed: the rendering state lives as long as the process.
  static auto* preparation = new ContactPhotoPreparation(
      platform::makeImageService, PhotoCache::openUserCache(), Threads::AllCores);
  return *preparation;
}

ContactPhotoPreparation::ContactPhotoPreparation(ImageServiceMaker maker,
                                                 std::unique_ptr<PhotoCache> cache, Threads threads)
    : maker_(std::move(maker)), cache_(std::move(cache)), threads_(threads) {}

platform::ImageService* ContactPhotoPreparation::imageService(Logging logging) {
  std::lock_guard lock(serviceMutex_);
  if (logging == Logging::Silent) {
    if (service_ || unloggedFailure_) return service_.get();
  } else {
    if (!serviceAnnounced_) Log::debug("Creating Vuro context");
    if (unloggedFailure_) {
      logServiceFailure(*std::exchange(unloggedFailure_, std::nullopt));
      return nullptr;
    }
    if (service_) {
      serviceAnnounced_ = true;
      return service_.get();
    }
  }
  auto made = maker_();
  if (auto* failure = std::get_if<platform::ImageServiceFailure>(&made)) {
    if (logging == Logging::Silent) {
      unloggedFailure_ = *failure;
    } else {
      logServiceFailure(*failure);
    }
    return nullptr;
  }
  service_ = std::move(std::get<std::unique_ptr<platform::ImageService>>(made));
  if (logging == Logging::Logged) serviceAnnounced_ = true;
  return service_.get();
}

void ContactPhotoPreparation::prefetch(std::span<const platform::Data* const> pictures,
                                       std::span<const PictureOrigin> origins) {
  prefetched_.clear();
  std::vector<const platform::Data*> work;
  std::vector<const PictureOrigin*> workOrigins;
  for (std::size_t i = 0; i < pictures.size(); ++i) {
    const platform::Data* picture = pictures[i];
    if (picture && needsConversion(*picture)) {
      work.push_back(picture);
      workOrigins.push_back(i < origins.size() ? &origins[i] : nullptr);
    }
  }
  if (work.empty()) return;
  std::vector<std::optional<PhotoConversion>> found(work.size());
  std::atomic<std::size_t> next{0};
  auto worker = [&] {
    for (std::size_t i = next++; i < work.size(); i = next++) {
      const platform::Data& picture = *work[i];
      PhotoKey key{};
      if (cache_) {
        key = workOrigins[i] ? cache_->rememberedKeyFor(picture, *workOrigins[i])
                             : PhotoCache::keyFor(picture);
        if ((found[i] = cache_->find(key))) continue;
      }
      platform::ImageService* service = imageService(Logging::Silent);
      if (!service) continue;
      found[i] = convert(*service, picture);
      if (cache_) cache_->store(key, *found[i]);
    }
  };
  std::size_t count = 1;
  if (threads_ == Threads::AllCores) {
    count = std::clamp<std::size_t>(std::thread::hardware_concurrency(), 1, work.size());
  }
  std::vector<std::jthread> helpers;
  try {
    for (std::size_t i = 1; i < count; ++i) helpers.emplace_back(worker);
  } catch (const std::system_error&) {
    // Fewer threads convert the same pictures.
  }
  worker();
  helpers.clear();
  for (std::size_t i = 0; i < work.size(); ++i) {
    if (found[i]) {
      prefetched_.insert_or_assign(work[i]->data(),
                                   Prefetched{work[i]->size(), std::move(*found[i])});
    }
  }
}

void ContactPhotoPreparation::finishRun() {
  prefetched_.clear();
  if (cache_) cache_->prune();
}

std::optional<PhotoConversion> ContactPhotoPreparation::conversionFor(
    const platform::Data& picture) {
  std::optional<PhotoConversion> known;
  if (auto it = prefetched_.find(picture.data()); it != prefetched_.end()) {
    if (it->second.size == picture.size()) known = std::move(it->second.conversion);
    prefetched_.erase(it);
  }
  PhotoKey key{};
  if (!known && cache_) {
    key = PhotoCache::keyFor(picture);
    known = cache_->find(key);
  }
  // A picture known without the service logs as if the service had been made for it then,
  // unless making it failed since; that failure is this card's, as it was the conversion's.
  if (known && !unloggedFailure_) {
    std::lock_guard lock(serviceMutex_);
    if (!serviceAnnounced_) Log::debug("Creating Vuro context");
    serviceAnnounced_ = true;
    return known;
  }
  platform::ImageService* service = imageService(Logging::Logged);
  if (!service) return std::nullopt;
  if (known) return known;
  PhotoConversion conversion = convert(*service, picture);
  if (cache_) cache_->store(key, conversion);
  return conversion;
}

std::optional<platform::Data> ContactPhotoPreparation::photoForContact(
    const platform::Dictionary& contact) {
  const platform::Data* picture = contact.dataAt(tessel::TesselAttribute_Contacts_Contact_Image);
  if (!picture || picture->empty()) return std::nullopt;
  if (picture->size() == 1) {
    Log::debug("Image for %@ is invalid (less than 2 bytes!)",
               nameText(contact, tessel::TesselAttribute_Contacts_Contact_FirstName));
    return std::nullopt;
  }

  if (!needsConversion(*picture)) return *picture;
  if ((*picture)[0] == 0xFF && (*picture)[1] == 0xD8) {
    Log::debug("Image size for %@ is %ul so it should be resized", nameLabel(contact),
               picture->size());
  } else {
    Log::debug("Image for %@ is not a JPEG file. Converting it", nameLabel(contact));
  }
  std::optional<PhotoConversion> conversion = conversionFor(*picture);
  if (!conversion) return std::nullopt;
  return replay(std::move(*conversion), *picture);
}

void ContactPhotoPreparation::appendPhoto(std::string& card, const platform::Dictionary& contact) {
  std::optional<platform::Data> photo = photoForContact(contact);
  if (!photo) return;
  // RFC 2426 section 3.1.4: an inline photo is carried in the "b" (base64) encoding.
  card += "PHOTO;BASE64:\r\n";
  appendBase64Block(card, *photo);
}

}  // namespace zt::contacts
