#include "importers/vcard_contact.h"

#include <algorithm>
#include <optional>
#include <stdexcept>
#include <utility>

#include "importers/import_error.h"
#include "importers/vcard_decoding.h"
#include "importers/vcard_identifiers.h"
#include "platform/ascii.h"
#include "tessel/schema.h"

namespace tessel::importers {

namespace {

using zt::platform::Data;
using zt::platform::Dictionary;
using zt::platform::lowerAscii;
using zt::platform::startsWithIgnoringAsciiCase;
using zt::platform::trimBlanks;
using zt::platform::Url;
using zt::platform::Value;

// Instant-messaging services: the extension properties of RFC 2426 section 3.8 that address
// books write, and the IMPP URI schemes of RFC 4770 and RFC 6350 section 6.4.3.
struct ImService {
  std::string_view property;  // "X-JABBER"
  std::string_view scheme;    // "xmpp"
  std::string_view service;   // what the record stores
};
constexpr ImService kImServices[] = {
    {"X-AIM", "aim", "AIM"},
    {"X-JABBER", "xmpp", "Jabber"},
    {"X-MSN", "msnim", "MSN"},
    {"X-YAHOO", "ymsgr", "Yahoo"},
    {"X-ICQ", "icq", "ICQ"},
    {"X-SKYPE", "skype", "Skype"},
    {"X-SKYPE-USERNAME", "callto", "Skype"},
    {"X-GOOGLE-TALK", "gtalk", "GoogleTalk"},
    {"X-GTALK", "googletalk", "GoogleTalk"},
    {"X-QQ", "qq", "QQ"},
    {"X-GADUGADU", "gg", "GaduGadu"},
};

const ImService* imServiceOfProperty(std::string_view property) {
  for (const ImService& im : kImServices) {
    if (im.property == property) return &im;
  }
  return nullptr;
}

std::string imServiceOfScheme(std::string_view scheme) {
  const std::string lower = lowerAscii(scheme);
  for (const ImService& im : kImServices) {
    if (im.scheme == lower) return std::string(im.service);
  }
  if (lower == "jabber") return "Jabber";
  if (lower == "msn") return "MSN";
  if (lower == "yahoo") return "Yahoo";
  if (lower == "sip") return "SIP";
  if (lower == "irc") return "IRC";
  return lower;
}

std::string joinNonEmpty(const std::vector<std::string>& parts, std::string_view separator) {
  std::string out;
  for (const std::string& part : parts) {
    if (part.empty()) continue;
    if (!out.empty()) out += separator;
    out += part;
  }
  return out;
}

// The three kinds every e-mail, address and IM record may carry: home, work, other.
std::optional<std::string_view> placeType(const ContentLine& line) {
  if (line.hasType("home")) return TesselEnumValue_Contacts_EmailAddress_Type_Home;
  if (line.hasType("work")) return TesselEnumValue_Contacts_EmailAddress_Type_Work;
  if (line.hasType("other") || line.hasType("x-other")) {
    return TesselEnumValue_Contacts_EmailAddress_Type_Other;
  }
  return std::nullopt;
}

// RFC 2426 section 3.3.1 and RFC 6350 section 6.4.1 TEL types. A fax says where it is; one
// that does not is taken for an office fax. "main" is the Apple and Google type of a
// company's switchboard number.
std::string_view phoneType(const ContentLine& line) {
  if (line.hasType("fax")) {
    return line.hasType("home") ? TesselEnumValue_Contacts_PhoneNumber_Type_HomeFax
                                : TesselEnumValue_Contacts_PhoneNumber_Type_WorkFax;
  }
  if (line.hasType("cell") || line.hasType("mobile") || line.hasType("iphone")) {
    return TesselEnumValue_Contacts_PhoneNumber_Type_Mobile;
  }
  if (line.hasType("pager")) return TesselEnumValue_Contacts_PhoneNumber_Type_Pager;
  if (line.hasType("main") || line.hasType("x-main")) {
    return TesselEnumValue_Contacts_PhoneNumber_Type_Main;
  }
  if (line.hasType("home")) return TesselEnumValue_Contacts_PhoneNumber_Type_Home;
  if (line.hasType("work")) return TesselEnumValue_Contacts_PhoneNumber_Type_Work;
  return TesselEnumValue_Contacts_PhoneNumber_Type_Other;
}

class Converter {
 public:
  Converter(const Card& card, const std::string& source, ImportWarnings& warnings)
      : card_(card),
        source_(source),
        warnings_(warnings),
        version21_(card.version == "2.1"),
        escapes_(version21_ ? TextEscapes::Version21 : TextEscapes::Version3) {}

  ConvertedCard convert() {
    result_.line = card_.line;
    for (const ContentLine& line : card_.properties) {
      try {
        property(line);
      } catch (const ImportError& fault) {
        noteFault(fault, "dropped the " + line.name, "");
      }
    }
    if (result_.kind == CardKind::Group) {
      ConvertedCard group = finishGroup();
      reportFaults();
      return group;
    }
    finishContact();
    reportFaults();
    return std::move(result_);
  }

 private:
  // The value's text in UTF-8, still escaped: transfer encoding and charset undone.
  std::string rawText(const ContentLine& line) const {
    std::string bytes;
    try {
      const std::string encoding = lowerAscii(line.parameter("ENCODING"));
      if (encoding == "quoted-printable") {
        bytes = decodeQuotedPrintable(line.value);
      } else if (encoding == "b" || encoding == "base64") {
        const Data decoded = decodeBase64(line.value);
        bytes.assign(decoded.begin(), decoded.end());
      } else {
        bytes = line.value;
      }
    } catch (const std::invalid_argument& e) {
      throw ImportError(source_, line.line, std::string(e.what()) + " in " + line.name);
    }
    const std::string_view charset = line.parameter("CHARSET");
    if (charset.empty()) return toUtf8(bytes, std::nullopt);
    try {
      return toUtf8(bytes, charset);
    } catch (const std::invalid_argument& e) {
      // The text is still there: read as if no charset were named, it is most often right
      // (writers name charsets they do not use), and it is never lost.
      std::string text = toUtf8(bytes, std::nullopt);
      noteFault(ImportError(source_, line.line, std::string(e.what()) + " in " + line.name),
                "read the " + line.name, text == bytes ? " as UTF-8" : " as Windows-1252");
      return text;
    }
  }

  // A fault of this card: raised at once when the import refuses faults, else reported
  // with the card's name once the card is read. A value read twice is reported once.
  // What it cost reads `action` (of the card ...) `tail`.
  void noteFault(const ImportError& fault, std::string action, std::string tail) const {
    if (warnings_.onFault() == OnFault::Refuse) throw fault;
    for (const CardFault& known : faults_) {
      if (known.fault.line() == fault.line() && known.fault.reason() == fault.reason()) return;
    }
    faults_.push_back({fault, std::move(action), std::move(tail)});
  }

  void reportFaults() {
    std::string name = !formatted_.empty() ? "\"" + formatted_ + "\""
                       : !(first_ + last_).empty()
                           ? "\"" + joinNonEmpty({first_, last_}, " ") + "\""
                       : !company_.empty() ? "\"" + company_ + "\""
                                           : "of line " + std::to_string(card_.line);
    for (const CardFault& each : faults_) {
      warnings_.fault(each.fault, each.action + " of the card " + name + each.tail);
    }
    faults_.clear();
  }

  std::string text(const ContentLine& line) const { return cleanText(rawText(line)); }

  std::vector<std::string> components(const ContentLine& line) const {
    std::vector<std::string> parts;
    for (const std::string& part : splitUnescaped(rawText(line), ';', escapes_)) {
      parts.push_back(cleanText(part));
    }
    return parts;
  }

  // Unescaped and trimmed, with every line end one "\n": quoted-printable values carry the
  // CRLF of the writer's system ("=0D=0A").
  std::string cleanText(std::string_view raw) const {
    const std::string text = unescapeText(raw, escapes_);
    std::string out;
    out.reserve(text.size());
    for (std::size_t i = 0; i < text.size(); ++i) {
      if (text[i] == '\r') {
        out += '\n';
        if (i + 1 < text.size() && text[i + 1] == '\n') ++i;
      } else {
        out += text[i];
      }
    }
    return std::string(trimBlanks(out));
  }

  // A name part of N: in 3.0 and 4.0 a comma-separated list (RFC 6350 section 6.2.2).
  std::string namePart(const std::vector<std::string>& raw, std::size_t index,
                       std::string_view separator) const {
    if (index >= raw.size()) return {};
    if (version21_) return cleanText(raw[index]);
    std::vector<std::string> parts;
    for (const std::string& part : splitUnescaped(raw[index], ',')) {
      parts.push_back(cleanText(part));
    }
    return joinNonEmpty(parts, separator);
  }

  void property(const ContentLine& line) {
    const std::string& name = line.name;
    if (name == "PHOTO") return photo(line);
    // Every other value is decoded, whether used or not, so that a broken one is reported.
    const std::string raw = rawText(line);
    if (name == "N") {
      const std::vector<std::string> parts = splitUnescaped(raw, ';', escapes_);
      // RFC 9554 section 4.6: an N with PHONETIC spells the name as it sounds.
      if (!line.parameter("PHONETIC").empty()) {
        setOnce(phoneticLast_, namePart(parts, 0, " "));
        setOnce(phoneticFirst_, namePart(parts, 1, " "));
        return;
      }
      if (seenN_) return;
      seenN_ = true;
      last_ = namePart(parts, 0, " ");
      first_ = namePart(parts, 1, " ");
      middle_ = namePart(parts, 2, " ");
      prefix_ = namePart(parts, 3, ", ");
      suffix_ = namePart(parts, 4, ", ");
    } else if (name == "FN") {
      setOnce(formatted_, text(line));
    } else if (name == "SOUND" && line.hasType("x-irmc-n")) {
      // IrMC (Japanese phones, vCard 2.1): the reading of N, family name first.
      const std::vector<std::string> parts = components(line);
      setOnce(phoneticLast_, parts.empty() ? std::string() : parts[0]);
      setOnce(phoneticFirst_, parts.size() > 1 ? parts[1] : std::string());
    } else if (name == "X-PHONETIC-FIRST-NAME") {
      setOnce(phoneticFirst_, text(line));
    } else if (name == "X-PHONETIC-LAST-NAME") {
      setOnce(phoneticLast_, text(line));
    } else if (name == "X-MAIDENNAME") {
      setOnce(maiden_, text(line));
    } else if (name == "NICKNAME") {
      for (const std::string& nick : splitUnescaped(raw, ',', escapes_)) {
        std::string one = cleanText(nick);
        if (!one.empty()) nicknames_.push_back(std::move(one));
      }
    } else if (name == "ORG") {
      if (!company_.empty() || !department_.empty()) return;
      std::vector<std::string> parts = components(line);
      company_ = parts.empty() ? std::string() : parts[0];
      if (!parts.empty()) parts.erase(parts.begin());
      department_ = joinNonEmpty(parts, ", ");
    } else if (name == "TITLE") {
      setOnce(jobTitle_, text(line));
    } else if (name == "NOTE") {
      std::string note = text(line);
      if (!note.empty()) notes_.push_back(std::move(note));
    } else if (name == "UID") {
      setOnce(result_.uid, text(line));
    } else if (name == "TEL") {
      phone(line, text(line));
    } else if (name == "EMAIL") {
      email(line, text(line));
    } else if (name == "ADR") {
      address(line);
    } else if (name == "URL") {
      url(line, raw);
    } else if (name == "IMPP") {
      impp(line, text(line));
    } else if (const ImService* service = imServiceOfProperty(name)) {
      im(line, std::string(service->service), text(line));
    } else if (name == "CATEGORIES") {
      categories(raw);
    } else if (name == "KIND" || name == "X-ADDRESSBOOKSERVER-KIND") {
      if (lowerAscii(text(line)) == "group") result_.kind = CardKind::Group;
    } else if (name == "MEMBER" || name == "X-ADDRESSBOOKSERVER-MEMBER") {
      std::string member = text(line);
      if (startsWithIgnoringAsciiCase(member, "urn:uuid:")) member.erase(0, 9);
      if (!member.empty()) result_.memberUids.push_back(std::move(member));
    }
  }

  static void setOnce(std::string& field, std::string value) {
    if (field.empty()) field = std::move(value);
  }

  void phone(const ContentLine& line, std::string number) {
    // RFC 6350 section 6.4.1: in 4.0 the value may be a tel: URI (RFC 3966).
    if (startsWithIgnoringAsciiCase(number, "tel:")) number.erase(0, 4);
    if (number.empty()) return;
    if (firstPhone_.empty()) firstPhone_ = number;
    addRelated(TesselRelationship_Contacts_Contact_PhoneNumbers, TesselEntity_Contacts_PhoneNumber,
               Dictionary{{TesselAttribute_Contacts_PhoneNumber_Value, std::move(number)},
                          {TesselAttribute_Contacts_PhoneNumber_Type, phoneType(line)}});
  }

  void email(const ContentLine& line, std::string address) {
    if (startsWithIgnoringAsciiCase(address, "mailto:")) address.erase(0, 7);
    if (address.empty()) return;
    if (firstEmail_.empty()) firstEmail_ = address;
    Dictionary record{{TesselAttribute_Contacts_EmailAddress_Value, std::move(address)}};
    if (auto type = placeType(line)) record.set(TesselAttribute_Contacts_EmailAddress_Type, *type);
    addRelated(TesselRelationship_Contacts_Contact_EmailAddresses,
               TesselEntity_Contacts_EmailAddress, std::move(record));
  }

  void address(const ContentLine& line) {
    // RFC 2426 section 3.2.1: post office box; extended address; street; locality; region;
    // postal code; country. The record has one street field for the first three.
    std::vector<std::string> parts = components(line);
    parts.resize(std::max<std::size_t>(parts.size(), 7));
    const std::string street = joinNonEmpty({parts[2], parts[1], parts[0]}, "\n");
    const std::pair<std::string_view, const std::string*> fields[] = {
        {TesselAttribute_Contacts_StreetAddress_Street, &street},
        {TesselAttribute_Contacts_StreetAddress_City, &parts[3]},
        {TesselAttribute_Contacts_StreetAddress_State, &parts[4]},
        {TesselAttribute_Contacts_StreetAddress_PostalCode, &parts[5]},
        {TesselAttribute_Contacts_StreetAddress_Country, &parts[6]},
    };
    Dictionary record{
        {TesselAttribute_Contacts_StreetAddress_Type,
         placeType(line).value_or(TesselEnumValue_Contacts_StreetAddress_Type_Other)}};
    bool any = false;
    for (const auto& [key, value] : fields) {
      if (value->empty()) continue;
      record.set(key, *value);
      any = true;
    }
    if (!any) return;
    addRelated(TesselRelationship_Contacts_Contact_StreetAddresses,
               TesselEntity_Contacts_StreetAddress, std::move(record));
  }

  void url(const ContentLine& line, const std::string& raw) {
    // Some address books escape the colon of the scheme ("http\://"), which no RFC asks for.
    std::string link;
    for (std::size_t i = 0; i < raw.size(); ++i) {
      if (raw[i] == '\\' && i + 1 < raw.size() && raw[i + 1] == ':') continue;
      link += raw[i];
    }
    link = std::string(trimBlanks(unescapeText(link, escapes_)));
    if (link.empty()) return;
    Dictionary record{{TesselAttribute_Contacts_URL_Value, Url{std::move(link)}}};
    for (const std::string& type : line.types()) {
      if (type == "pref" || type == "internet") continue;
      record.set(TesselAttribute_Contacts_URL_Type, type);
      break;
    }
    addRelated(TesselRelationship_Contacts_Contact_URLs, TesselEntity_Contacts_URL,
               std::move(record));
  }

  void impp(const ContentLine& line, const std::string& uri) {
    // RFC 4770: "xmpp:alice@example.com", "aim:goim?screenname=alice", "skype:alice?chat".
    const std::size_t colon = uri.find(':');
    if (colon == std::string::npos) return im(line, "", uri);
    std::string service = imServiceOfScheme(uri.substr(0, colon));
    // Apple's address book names the service itself, even for schemes it shares.
    if (const std::string_view named = line.parameter("X-SERVICE-TYPE"); !named.empty()) {
      service = std::string(named);
    }
    std::string_view user = std::string_view(uri).substr(colon + 1);
    if (user.starts_with("//")) user.remove_prefix(2);
    if (const std::size_t query = user.find('?'); query != std::string_view::npos) {
      const std::string_view parameters = user.substr(query + 1);
      user = user.substr(0, query);
      if (user.empty() || user == "goim" || user == "addbuddy") {
        const std::size_t name = parameters.find("screenname=");
        if (name != std::string_view::npos) {
          user = parameters.substr(name + 11);
          user = user.substr(0, user.find('&'));
        }
      }
    }
    std::string decoded;
    try {
      decoded = decodePercent(user);
    } catch (const std::invalid_argument&) {
      decoded = std::string(user);
    }
    im(line, std::move(service), std::move(decoded));
  }

  void im(const ContentLine& line, std::string service, std::string user) {
    if (user.empty()) return;
    // Address books write the same account as IMPP and as an X- property; one record is enough.
    const std::string key = lowerAscii(service) + '\n' + user;
    if (std::find(ims_.begin(), ims_.end(), key) != ims_.end()) return;
    ims_.push_back(key);
    Dictionary record{{TesselAttribute_Contacts_IM_User, std::move(user)}};
    if (!service.empty()) record.set(TesselAttribute_Contacts_IM_Service, std::move(service));
    record.set(TesselAttribute_Contacts_IM_Type,
               placeType(line).value_or(TesselEnumValue_Contacts_URL_IM_Type_Home));
    addRelated(TesselRelationship_Contacts_Contact_IMs, TesselEntity_Contacts_IM,
               std::move(record));
  }

  void categories(const std::string& raw) {
    // RFC 2426 section 3.6.1: a comma-separated list. vCard 2.1 never defined the property;
    // its writers separate with ";" as well.
    std::vector<std::string> names;
    for (const std::string& item : splitUnescaped(raw, ',', escapes_)) {
      if (version21_) {
        for (const std::string& part : splitUnescaped(item, ';', escapes_)) names.push_back(part);
      } else {
        names.push_back(item);
      }
    }
    for (const std::string& item : names) {
      std::string name = cleanText(item);
      if (name.empty()) continue;
      auto& groups = result_.groupNames;
      if (std::find(groups.begin(), groups.end(), name) == groups.end()) {
        groups.push_back(std::move(name));
      }
    }
  }

  void photo(const ContentLine& line) {
    const std::string encoding = lowerAscii(line.parameter("ENCODING"));
    Data bytes;
    try {
      // A data: URI is one whatever the parameters say: some writers label it ENCODING=b
      // as well (and base64 has no ':').
      if (startsWithIgnoringAsciiCase(trimBlanks(line.value), "data:")) {
        // RFC 2397: data:[<media type>][;base64],<data>
        const std::string_view uri = trimBlanks(line.value);
        const std::size_t comma = uri.find(',');
        if (comma == std::string_view::npos) throw std::invalid_argument("bad data: URI");
        std::string meta = lowerAscii(uri.substr(5, comma - 5));
        // A URI is no text value, yet writers escape its comma as in text ("base64\,").
        if (meta.ends_with('\\')) meta.pop_back();
        const std::string_view payload = uri.substr(comma + 1);
        if (meta.ends_with(";base64")) {
          bytes = decodeBase64(payload);
        } else {
          const std::string decoded = decodePercent(payload);
          bytes.assign(decoded.begin(), decoded.end());
        }
      } else if (encoding == "b" || encoding == "base64") {
        bytes = decodeBase64(line.value);
      } else {
        // A photo by reference (an http: URI) is not fetched.
        return;
      }
    } catch (const std::invalid_argument& e) {
      throw ImportError(source_, line.line, std::string(e.what()) + " in PHOTO");
    }
    if (image_.empty()) image_ = std::move(bytes);
  }

  void addRelated(std::string_view relationship, std::string_view entity, Dictionary fields) {
    Dictionary record{{TesselRecordEntityNameKey, entity}};
    for (const auto& [key, value] : fields) record.set(key, value);
    result_.related.push_back({relationship, Record{{}, std::move(record)}});
  }

  ConvertedCard finishGroup() {
    std::string name = formatted_.empty() ? joinNonEmpty({first_, last_}, " ") : formatted_;
    result_.groupNames.clear();
    if (!name.empty()) result_.groupNames.push_back(std::move(name));
    result_.related.clear();
    return std::move(result_);
  }

  void finishContact() {
    // RFC 6350 section 6.2.1: FN is the name to show. Without a personal name in N, it is
    // the name: its last word taken for the family name. A card of a company names the
    // company in FN; the company name alone shows it.
    if (last_.empty() && first_.empty() && middle_.empty() && !formatted_.empty() &&
        formatted_ != company_) {
      const std::size_t space = formatted_.find_last_of(' ');
      if (space == std::string::npos) {
        first_ = formatted_;
      } else {
        first_ = std::string(trimBlanks(std::string_view(formatted_).substr(0, space)));
        last_ = formatted_.substr(space + 1);
      }
    }

    Dictionary& record = result_.attributes;
    record.set(TesselRecordEntityNameKey, TesselEntity_Contacts_Contact);
    const std::pair<std::string_view, std::string> fields[] = {
        {TesselAttribute_Contacts_Contact_FirstName, first_},
        {TesselAttribute_Contacts_Contact_LastName, last_},
        {TesselAttribute_Contacts_Contact_MiddleName, middle_},
        {TesselAttribute_Contacts_Contact_Title, prefix_},
        {TesselAttribute_Contacts_Contact_Suffix, suffix_},
        {TesselAttribute_Contacts_Contact_Nickname, joinNonEmpty(nicknames_, ", ")},
        {TesselAttribute_Contacts_Contact_MaidenName, maiden_},
        {TesselAttribute_Contacts_Contact_FirstNameYomi, phoneticFirst_},
        {TesselAttribute_Contacts_Contact_LastNameYomi, phoneticLast_},
        {TesselAttribute_Contacts_Contact_CompanyName, company_},
        {TesselAttribute_Contacts_Contact_Department, department_},
        {TesselAttribute_Contacts_Contact_JobTitle, jobTitle_},
        {TesselAttribute_Contacts_Contact_Notes, joinNonEmpty(notes_, "\n")},
    };
    for (const auto& [key, value] : fields) {
      if (!value.empty()) record.set(key, value);
    }
    if (!image_.empty()) record.set(TesselAttribute_Contacts_Contact_Image, image_);

    if (!result_.uid.empty()) {
      result_.identifier = contactIdentifierForUid(result_.uid);
    } else {
      // The fields that tell people apart, each closed by a unit separator so that moving
      // text from one field to the next makes another identity.
      std::string identity;
      for (const std::string* field : {&last_, &first_, &middle_, &prefix_, &suffix_, &formatted_,
                                       &company_, &firstEmail_, &firstPhone_}) {
        identity += *field;
        identity += '\x1f';
      }
      result_.identifier = contactIdentifierForHash(identity);
    }
    std::size_t counts[5] = {};
    for (RelatedRecord& related : result_.related) {
      static constexpr std::pair<std::string_view, std::string_view> kKinds[] = {
          {TesselRelationship_Contacts_Contact_PhoneNumbers, "tel"},
          {TesselRelationship_Contacts_Contact_EmailAddresses, "email"},
          {TesselRelationship_Contacts_Contact_StreetAddresses, "adr"},
          {TesselRelationship_Contacts_Contact_URLs, "url"},
          {TesselRelationship_Contacts_Contact_IMs, "im"},
      };
      for (std::size_t k = 0; k < std::size(kKinds); ++k) {
        if (kKinds[k].first != related.relationship) continue;
        related.record.id = relatedIdentifier(result_.identifier, kKinds[k].second, counts[k]++);
      }
    }
  }

  const Card& card_;
  const std::string& source_;
  ImportWarnings& warnings_;
  struct CardFault {
    ImportError fault;
    std::string action, tail;
  };
  mutable std::vector<CardFault> faults_;
  const bool version21_;
  const TextEscapes escapes_;
  ConvertedCard result_;
  bool seenN_ = false;
  std::string first_, last_, middle_, prefix_, suffix_, formatted_, maiden_;
  std::string phoneticFirst_, phoneticLast_, company_, department_, jobTitle_;
  std::vector<std::string> nicknames_, notes_, ims_;
  std::string firstEmail_, firstPhone_;
  Data image_;
};

}  // namespace

ConvertedCard convertCard(const Card& card, const std::string& source, ImportWarnings& warnings) {
  return Converter(card, source, warnings).convert();
}

}  // namespace tessel::importers
