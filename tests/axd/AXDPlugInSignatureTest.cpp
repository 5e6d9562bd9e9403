#include <gtest/gtest.h>

#include "axd/AXDPlugInSignature.h"

namespace {

TEST(AXDPlugInSignatureTest, EverySignatureIsNew) {
  AXDPlugInSignature first(AXFileURL("/Apps/Host.app/PlugIns/Tool.appex"));
  AXDPlugInSignature second(AXFileURL("/Apps/Host.app/PlugIns/Tool.appex"));
  EXPECT_NE(first.cdhash(), second.cdhash());
  EXPECT_EQ(first.requirement(), "dummy requirement");
  EXPECT_EQ(second.requirement(), "dummy requirement");
}

}  // namespace
