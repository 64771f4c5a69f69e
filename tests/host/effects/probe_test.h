#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "tests/host/effects/drawn_clip.h"
#include "tests/host/effects/probe.h"

namespace calmframe::host {

// A host of the probe, which does at each command what the test wants; what it leaves behind or
// does wrong fails the test.
class ProbeTest : public testing::Test {
 protected:
  using Call = probe::Call;
  using Deed = std::function<HX_Err(const Call&)>;

  ProbeTest() {
    probe::Behaviour() = [this](const Call& call) {
      const auto deed = on.find(call.command);
      return deed == on.end() ? HX_ERR_NONE : deed->second(call);
    };
  }
  ~ProbeTest() override { probe::Behaviour() = nullptr; }
  void TearDown() override {
    Operations::Get().FailNone();
    if (host) {
      EXPECT_EQ(LeftBehind(), "");
    }
  }

  // Starts the plug-in.
  void Start(const HostSettings& settings = {}) {
    host = std::make_unique<Host>(PROBE_PLUGIN, settings);
    host->worlds().SetRowPadding(8);
    host->handles().MoveOnUnlock(true);
    session = std::make_unique<Session>(*host);
  }
  // What the plug-in holds, and did wrong, when all is gone.
  std::string LeftBehind() {
    session.reset();
    EXPECT_TRUE(host->Stop().ok());
    const std::string report = host->LeakReport();
    host.reset();
    return report;
  }

  std::map<std::uint32_t, Deed> on;  // by command; none: it does nothing
  std::unique_ptr<Host> host;
  std::unique_ptr<Session> session;
};

// A suite, for as long as this stands.
template <class Table>
class Suite {
 public:
  Suite(const probe::Call& call, const char* name, std::int32_t version)
      : basic_(*call.in->basic), name_(name), version_(version) {
    const void* table = nullptr;
    EXPECT_EQ(basic_.acquire(name, version, &table), HX_ERR_NONE) << name;
    table_ = static_cast<const Table*>(table);
  }
  ~Suite() { basic_.release(name_, version_); }
  Suite(const Suite&) = delete;
  Suite& operator=(const Suite&) = delete;
  const Table* operator->() const { return table_; }

 private:
  const HX_BasicSuite& basic_;
  const char* const name_;
  const std::int32_t version_;
  const Table* table_;
};

}  // namespace calmframe::host
