#include <gtest/gtest.h>

#include <cerrno>

#include "bench/PlugInPopulation.h"
#include "platform/registrum/Workspace.h"
#include "tests/platform/TempDirectory.h"

namespace {

TEST(PlugInPopulation, InstallsEveryPlugInInPathOrderInApplicationsOfTheGivenSize) {
  TempDirectory root;
  auto applications = PlugInPopulation::write(root.path(), 5, 2);
  ASSERT_TRUE(applications.ok()) << applications.error().message;
  ASSERT_EQ(applications.value().size(), 3u);
  ASSERT_TRUE(PlugInPopulation::install(root.path(), applications.value()).ok());

  auto registry = registrum::Workspace::open(root.path());
  ASSERT_TRUE(registry.ok());
  auto plugIns = registry.value()->listPlugIns();
  ASSERT_TRUE(plugIns.ok());
  ASSERT_EQ(plugIns.value().size(), 5u);
  for (std::size_t i = 0; i < 5; ++i) {
    const registrum::PlugInRecord& record = *plugIns.value()[i];
    EXPECT_EQ(record.plugInIdentifier(), PlugInPopulation::identifier(i));
    EXPECT_EQ(record.extensionPointIdentifier(), PlugInPopulation::kExtensionPoint);
    EXPECT_EQ(record.containingApplication()->path(), applications.value()[i / 2]);
  }
  // Installing the same applications again is refused, not doubled.
  EXPECT_EQ(PlugInPopulation::install(root.path(), applications.value()).error().errnum, EEXIST);
}

TEST(PlugInPopulation, FailsClearlyWhereNothingCanBeWritten) {
  EXPECT_EQ(PlugInPopulation::write("/tmp", 1, 0).error().errnum, EINVAL);
  auto unwritable = PlugInPopulation::write("/proc/self/nonexistent", 1, 1);
  ASSERT_FALSE(unwritable.ok());
  EXPECT_NE(unwritable.error().message, "");
}

}  // namespace
