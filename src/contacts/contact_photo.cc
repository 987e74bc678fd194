#include "contacts/contact_photo.h"

#include <algorithm>
#include <cmath>

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

}  // namespace

ContactPhotoPreparation& ContactPhotoPreparation::shared() {
  // Never destroyed: the rendering state lives as long as the process.
  static auto* preparation = new ContactPhotoPreparation(platform::makeImageService);
  return *preparation;
}

ContactPhotoPreparation::ContactPhotoPreparation(ImageServiceMaker maker)
    : maker_(std::move(maker)) {}

platform::ImageService* ContactPhotoPreparation::imageService() {
  if (service_) return service_.get();
  Log::debug("Creating Vuro context");
  auto made = maker_();
  if (auto* failure = std::get_if<platform::ImageServiceFailure>(&made)) {
    if (*failure == platform::ImageServiceFailure::OutOfMemory) {
      Log::always("Unable to allocate memory");
    } else {
      Log::always("Unable to create Dravo context");
    }
    return nullptr;
  }
  service_ = std::move(std::get<std::unique_ptr<platform::ImageService>>(made));
  return service_.get();
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

  // The JPEG start-of-image marker is all that is looked at.
  const bool jpeg = (*picture)[0] == 0xFF && (*picture)[1] == 0xD8;
  if (jpeg && picture->size() <= kLargestEmbeddedJPEG) return *picture;
  const bool converted = !jpeg;
  if (jpeg) {
    Log::debug("Image size for %@ is %ul so it should be resized", nameLabel(contact),
               picture->size());
  } else {
    Log::debug("Image for %@ is not a JPEG file. Converting it", nameLabel(contact));
  }

  platform::ImageService* service = imageService();
  if (!service) return std::nullopt;
  std::unique_ptr<platform::Image> image = service->decode(*picture);
  const platform::PixelSize extent = image ? image->extent() : platform::PixelSize{};
  if (extent.width <= 0 || extent.height <= 0) {
    Log::debug("Image is invalid, ignoring");
    return std::nullopt;
  }

  // The factor is kept in single precision, as the player's software always computed it.
  const float factor = static_cast<float>(std::min(kSide / extent.width, kSide / extent.height));
  platform::PixelSize target = extent;
  std::unique_ptr<platform::Image> scaled;
  if (factor < 1.0f) {
    Log::debug("Resizing to %ulx%ul (x%f)", 256, 256, double{factor});
    scaled = service->scale(*image, factor);
    if (!scaled) {
      Log::debug("Did not reduce image... using the one in truth");
      return *picture;
    }
    target = {std::max(1, static_cast<int>(std::lround(extent.width * double{factor}))),
              std::max(1, static_cast<int>(std::lround(extent.height * double{factor})))};
  } else {
    Log::debug("Not resizing (keeping size %fx%f)", double{1.0} * extent.width,
               double{1.0} * extent.height);
  }

  std::unique_ptr<platform::Image> bitmap = service->render(scaled ? *scaled : *image, target);
  if (!bitmap) {
    Log::debug("Did not reduce image... using the one in truth");
    return *picture;
  }
  std::optional<platform::Data> reduced = service->encodeJPEG(*bitmap);
  if (!reduced) {
    Log::always("Cannot create image destination");
    return std::nullopt;
  }
  // A JPEG is only ever replaced by a smaller one; a converted picture is always replaced,
  // because the player reads nothing but JPEG.
  if (!converted && reduced->size() > picture->size()) {
    Log::debug("After reducing the image, size is %ul, so we better use the one in truth",
               reduced->size());
    return *picture;
  }
  Log::debug("After reducing/converting the image, size is %ul", reduced->size());
  return reduced;
}

void ContactPhotoPreparation::appendPhoto(std::string& card, const platform::Dictionary& contact) {
  std::optional<platform::Data> photo = photoForContact(contact);
  if (!photo) return;
  // RFC 2426 section 3.1.4: an inline photo is carried in the "b" (base64) encoding.
  card += "PHOTO;BASE64:\r\n";
  appendBase64Block(card, *photo);
}

}  // namespace zt::contacts
