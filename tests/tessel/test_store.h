#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "platform/value.h"
#include "support/temporary_folder.h"
#include "tessel/change.h"
#include "tessel/filtering.h"
#include "tessel/record.h"
#include "tessel/session.h"
#include "tessel/store.h"

namespace tessel::testing {

// Each test gets a store file in a fresh temporary folder, removed afterwards.
class StoreTest : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  zt::test_support::TemporaryFolder folder_;
  std::filesystem::path storePath_;
  std::unique_ptr<Store> store_;
};

// A contact record with a first name and parent groups.
Record contact(std::string id, std::string firstName, std::vector<std::string> groups = {});
Record group(std::string id, std::string name);

// Every change a session offers for these entities, in order.
std::vector<Change> drain(Session& session, const std::vector<std::string>& entityNames);
// "A:id" / "M:id" / "D:id" per change, for compact comparisons.
std::vector<std::string> summary(const std::vector<Change>& changes);

// A filter for tests: passes contacts whose first name is not in `refused`. Registered as
// "TestNameFilter" while a test runs.
class NameFilter : public Filtering {
 public:
  static constexpr const char* kClassName = "TestNameFilter";
  explicit NameFilter(std::vector<std::string> refused) : refused_(std::move(refused)) {}
  static void registerClass();
  static void unregisterClass();

  const std::vector<std::string>& refused() const { return refused_; }
  std::string className() const override { return kClassName; }
  std::vector<std::string> supportedEntityNames() const override;
  bool shouldApplyRecord(const zt::platform::Dictionary& record,
                         const std::string& identifier) const override;
  bool isEqual(const Filtering& other) const override;
  void encode(Coder& coder) const override;
  std::string description() const override { return "NameFilter"; }

 private:
  std::vector<std::string> refused_;
};

}  // namespace tessel::testing
