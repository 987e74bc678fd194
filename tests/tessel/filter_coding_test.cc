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

TEST(FilterCoding, ValuesAndListsComeBackInOrderAndAnythingElseRaises) {
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
  // Reading past the end, the wrong kind, or garbage raises.
  EXPECT_THROW(decoder.decodeValue(), Exception);
  EXPECT_THROW(Decoder(coder.data()).decodeElements(), Exception);
  EXPECT_THROW(Decoder(Data{0x45, 0x05, 0x52, 0x7f, 'a'}).decodeElements(), Exception);
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
  ASSERT_NE(dynamic_cast<OpaqueFilter*>(filters[0].get()), nullptr);
  EXPECT_EQ(filters[0]->className(), "ForeignFilter");
  EXPECT_EQ(dynamic_cast<NameFilter&>(*filters[1]).refused(), std::vector<std::string>{"Bob"});
  EXPECT_EQ(dynamic_cast<OpaqueFilter&>(*filters[2]).payload(), Data{});

  // Written back as read: still the same bytes, and equal filters.
  client->setFilters(filters);
  FilterList again = client->filters();
  EXPECT_EQ(dynamic_cast<OpaqueFilter&>(*again[0]).payload(), foreign);
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

}  // namespace
}  // namespace tessel::testing
