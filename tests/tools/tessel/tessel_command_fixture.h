#pragma once

// Runs the built `tessel` binary the way users and scripts do, each test in a fresh folder
// with its own store.

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "support/files.h"
#include "support/process.h"
#include "support/temporary_folder.h"

namespace tessel::testing {

namespace fs = std::filesystem;

using Outcome = zt::test_support::ProcessRun;
using zt::test_support::readFile;
using zt::test_support::writeFile;

class TesselCommandTest : public ::testing::Test {
 protected:
  void SetUp() override { store_ = dir_ / "truth.db"; }

  // `tessel --store <store> args...`, with `input` on standard input.
  Outcome tessel(const std::vector<std::string>& args, const std::string& input = "") {
    std::vector<std::string> argv = {TESSEL_BINARY, "--store", store_.string()};
    argv.insert(argv.end(), args.begin(), args.end());
    return runRaw(argv, input);
  }

  Outcome runRaw(const std::vector<std::string>& args, const std::string& input = "") {
    zt::test_support::ProcessOptions options;
    options.input = input;
    return zt::test_support::runProcess(args, options);
  }

  // The store's records as `records list --json` writes them.
  std::string listJson() {
    const Outcome run = tessel({"records", "list", "--json"});
    EXPECT_EQ(run.status, 0) << run.err;
    return run.out;
  }

  zt::test_support::TemporaryFolder dir_;
  fs::path store_;
};

}  // namespace tessel::testing
