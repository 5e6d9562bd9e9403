#include <gtest/gtest.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <set>
#include <sstream>
#include <string>

#include "platform/os/Paths.h"
#include "platform/os/Probes.h"

namespace {

// Fires every probe once: none may fail or need a tracer.
void fireEveryProbe() {
  int pid = 42;
  std::string text = "{ type = match }";
  os::Probes::clientNew(pid);
  os::Probes::clientDone(pid);
  if (os::Probes::requestInputEnabled()) os::Probes::requestInput(pid, text.c_str());
  os::Probes::request(pid, nullptr);
  if (os::Probes::requestOutputEnabled()) os::Probes::requestOutput(pid, text.c_str());
  os::Probes::discoverRaw(3);
  os::Probes::pluginAdd("/System/Apps/A.app/PlugIns/P.appex");
  os::Probes::pluginRemove("/nowhere", false);
  os::Probes::pluginReady("00000000-0000-0000-0000-000000000000");
  os::Probes::dbLoad("Annexa", std::uint64_t{259});
}

TEST(ProbesTest, GuardedProbesAreOffWithoutATracer) {
  EXPECT_FALSE(os::Probes::requestInputEnabled());
  EXPECT_FALSE(os::Probes::requestOutputEnabled());
  fireEveryProbe();
}

#if defined(AXD_HAVE_SDT)

// The probes of provider axd that this binary's stapsdt notes list with a semaphore.
std::multiset<std::string> probesWithSemaphores(const std::string& binary) {
  std::multiset<std::string> names;
  FILE* pipe = popen(("readelf -n '" + binary + "' 2>/dev/null").c_str(), "r");
  if (!pipe) return names;
  std::string provider, name, line;
  char buffer[512];
  while (fgets(buffer, sizeof buffer, pipe)) {
    std::istringstream words(buffer);
    std::string key;
    words >> key;
    if (key == "Provider:") words >> provider;
    if (key == "Name:") words >> name;
    std::string text(buffer);
    std::size_t semaphore = text.find("Semaphore: ");
    if (key == "Location:" && provider == "axd" && semaphore != std::string::npos &&
        std::stoull(text.substr(semaphore + 11), nullptr, 16) != 0) {
      names.insert(name);
    }
  }
  pclose(pipe);
  return names;
}

TEST(ProbesTest, TheBinaryListsTenProbesWithSemaphores) {
  auto self = os::Paths::canonical("/proc/self/exe");
  ASSERT_TRUE(self.ok());
  std::multiset<std::string> names = probesWithSemaphores(self.value());
  if (names.empty() && std::system("readelf --version >/dev/null 2>&1") != 0) {
    GTEST_SKIP() << "readelf is not installed";
  }
  std::multiset<std::string> expected = {
      "client__new",   "client__done", "request__input", "request",       "request__output",
      "discover__raw", "plugin__add",  "plugin__remove", "plugin__ready", "db__load"};
  EXPECT_EQ(names, expected);
}

#endif

}  // namespace
