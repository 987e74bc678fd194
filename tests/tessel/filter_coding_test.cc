#include "tessel/coder.h"
#include "tessel/decoder.h"
#include "tessel/exception.h"
#include "tessel/filter_registry.h"
#include "tessel/opaque_filter.h"
#include "tessel/schema.h"
#include "tessel/test_store.h"

namespace tessel::testing {
namespace {

using zt::platform::Data;
using zt::platform::Value;

TEST(FilterCoding, ValuesAndMixedListsComeBackInOrderKeepingReferencesApartFromIdentifiers) {
  RecordReference reference = RecordReference::fromText("tessel-record:42");
  Coder coder;
  coder.encodeValue(Value::boolean(false));
  // An identifier that looks like a reference must stay an identifier.
  coder.encodeElements({reference, std::string("g1"), std::string("tessel-record:42")});
  coder.encodeElements({});

  Decoder decoder(coder.data());
  EXPECT_EQ(decoder.decodeValue().asNumber()->kind(), zt::platform::Number::Kind::Boolean);
  CodedElements elements = decoder.decodeElements();
  ASSERT_EQ(elements.size(), 3u);
  EXPECT_EQ(std::get<RecordReference>(elements[0]), reference);
  EXPECT_EQ(std::get<std::string>(elements[1]), "g1");
  EXPECT_EQ(std::get<std::string>(elements[2]), "tessel-record:42");
  EXPECT_TRUE(decoder.decodeElements().empty());
  EXPECT_TRUE(decoder.atEnd());
}

TEST(FilterCoding, ReadingPastTheEndOrTheWrongKindOrGarbageRaises) {
  Coder coder;
  coder.encodeValue(Value::integer(7));
  Data payload = coder.data();
  {
    Decoder decoder(payload);
    EXPECT_THROW(decoder.decodeElements(), Exception);
  }
  {
    Decoder decoder(payload);
    decoder.decodeValue();
    EXPECT_THROW(decoder.decodeValue(), Exception);
  }
  Data truncated{0x45, 0x05, 0x52, 0x7f, 'a'};
  Decoder decoder(truncated);
  EXPECT_THROW(decoder.decodeElements(), Exception);
}

using ClientFilters = StoreTest;

TEST_F(ClientFilters, RegisteredClassesDecodeAndUnknownOnesAreKeptByteForByte) {
  auto client = store_->registerClient("Z1", "Player", {});
  // Not a payload this engine could have written: it must survive untouched anyway.
  Data foreign{0x00, 0x01, 0xfe, 0xff, 'b', 'p', 'l', 'i', 's', 't', 0x00};
  client->setFilters({std::make_shared<OpaqueFilter>("ForeignFilter", foreign),
                      std::make_shared<NameFilter>(std::vector<std::string>{"Bob"}),
                      std::make_shared<OpaqueFilter>("EmptyFilter", Data{})});

  FilterList filters = store_->clientWithIdentifier("Z1")->filters();
  ASSERT_EQ(filters.size(), 3u);
  auto* opaque = dynamic_cast<OpaqueFilter*>(filters[0].get());
  ASSERT_NE(opaque, nullptr);
  EXPECT_EQ(opaque->className(), "ForeignFilter");
  EXPECT_EQ(opaque->payload(), foreign);
  auto* name = dynamic_cast<NameFilter*>(filters[1].get());
  ASSERT_NE(name, nullptr);
  EXPECT_EQ(name->refused(), std::vector<std::string>{"Bob"});
  EXPECT_EQ(dynamic_cast<OpaqueFilter*>(filters[2].get())->payload(), Data{});

  // Written back as read: still the same bytes, and equal filters.
  client->setFilters(filters);
  FilterList again = client->filters();
  EXPECT_EQ(dynamic_cast<OpaqueFilter*>(again[0].get())->payload(), foreign);
  EXPECT_TRUE(again[0]->isEqual(*filters[0]));
  EXPECT_TRUE(again[1]->isEqual(*filters[1]));
  EXPECT_FALSE(again[0]->isEqual(*filters[1]));

  // Once its class is unknown to the process, the test filter too is kept as bytes.
  Data coded = FilterRegistry::encode(*filters[1]);
  NameFilter::unregisterClass();
  FilterList unknown = client->filters();
  auto* kept = dynamic_cast<OpaqueFilter*>(unknown[1].get());
  ASSERT_NE(kept, nullptr);
  EXPECT_EQ(kept->className(), NameFilter::kClassName);
  EXPECT_EQ(kept->payload(), coded);
  client->setFilters(unknown);
  NameFilter::registerClass();
  EXPECT_TRUE(client->filters()[1]->isEqual(*filters[1]));
}

TEST_F(ClientFilters, AFilterCodingRecordReferencesResolvesThemThroughASnapshot) {
  store_->putRecords({group("g1", "Friends"), group("g2", "Work")});
  auto client = store_->registerClient("Z1", "Player", {});
  auto snapshot = store_->snapshotOfRecordsInTruth(
      {std::string(TesselEntity_Contacts_Group), std::string(TesselEntity_Calendars_Calendar)},
      *client);
  Coder coder;
  coder.encodeElements({*snapshot->recordReferenceForRecordIdentifier("g2"), std::string("g1")});
  client->setFilters({std::make_shared<OpaqueFilter>("GroupFilter", coder.data())});

  Data payload = dynamic_cast<OpaqueFilter&>(*client->filters()[0]).payload();
  Decoder decoder(payload);
  CodedElements elements = decoder.decodeElements();
  EXPECT_EQ(snapshot->recordIdentifierForReference(std::get<RecordReference>(elements[0])), "g2");
  EXPECT_EQ(std::get<std::string>(elements[1]), "g1");
}

}  // namespace
}  // namespace tessel::testing
