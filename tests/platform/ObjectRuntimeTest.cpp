#include <gtest/gtest.h>

#include "platform/runtime/MessageInterface.h"
#include "platform/runtime/Runtime.h"

namespace {

using runtime::Argument;
using runtime::MessageInterface;
using runtime::Protocol;
using runtime::Runtime;
using value::Value;

class MessageInterfaceCheck : public ::testing::Test {
 protected:
  MessageInterfaceCheck() {
    rt.addProtocol("Progress", {}, {"report:"});
    rt.addProtocol("DetailedProgress", {"Progress"}, {});
    tool = rt.addProtocol("Tool", {}, {"run:with:", "stop"});
    evenClass =
        rt.addClass("Even", [](const Value& v) { return v.asInt() && *v.asInt() % 2 == 0; });
  }

  Runtime rt;
  std::shared_ptr<const Protocol> tool;
  std::shared_ptr<const runtime::Class> evenClass;
};

TEST_F(MessageInterfaceCheck, ClassesAdmitOnlyTheirInstances) {
  MessageInterface interface(tool);
  interface.setClasses({rt.lookUpClass("String"), evenClass}, "run:with:", 0, false);
  EXPECT_TRUE(interface.check("run:with:", 0, false, Value::string("go")).ok());
  EXPECT_TRUE(interface.check("run:with:", 0, false, Value::integer(4)).ok());

  os::Status odd = interface.check("run:with:", 0, false, Value::integer(3));
  ASSERT_FALSE(odd.ok());
  EXPECT_EQ(odd.error().message, "argument 0 of run:with: must be one of String, Even, not 3");
  auto progress = Argument::proxy(rt.lookUpProtocol("Progress"));
  EXPECT_FALSE(interface.check("run:with:", 0, false, progress).ok());
  // The reply's argument 0 is another slot, still unconfigured.
  EXPECT_TRUE(interface.check("run:with:", 0, true, Value::integer(3)).ok());
}

TEST_F(MessageInterfaceCheck, NestedInterfacesAdmitConformingProxiesOnly) {
  MessageInterface interface(tool);
  auto nested = std::make_shared<MessageInterface>(rt.lookUpProtocol("Progress"));
  interface.setInterface(nested, "run:with:", 1, false);
  EXPECT_EQ(interface.interface("run:with:", 1, false), nested);
  EXPECT_EQ(interface.classes("run:with:", 1, false), nullptr);

  EXPECT_TRUE(
      interface.check("run:with:", 1, false, Argument::proxy(rt.lookUpProtocol("DetailedProgress")))
          .ok());
  EXPECT_FALSE(interface.check("run:with:", 1, false, Argument::proxy(tool)).ok());
  os::Status plain = interface.check("run:with:", 1, false, Value::string("x"));
  ASSERT_FALSE(plain.ok());
  EXPECT_EQ(plain.error().message,
            "argument 1 of run:with: must be a proxy of Progress, not \"x\"");

  // Setting classes replaces the nested interface of that slot.
  interface.setClasses({evenClass}, "run:with:", 1, false);
  EXPECT_EQ(interface.interface("run:with:", 1, false), nullptr);
  EXPECT_TRUE(interface.check("run:with:", 1, false, Value::integer(2)).ok());
}

TEST_F(MessageInterfaceCheck, UnconfiguredSlotsTakeValuesButNeitherProxiesNorUnknownSelectors) {
  MessageInterface interface(tool);
  EXPECT_TRUE(interface.check("stop", 0, true, Value::data({1, 2})).ok());
  os::Status proxy =
      interface.check("stop", 0, true, Argument::proxy(rt.lookUpProtocol("Progress")));
  ASSERT_FALSE(proxy.ok());
  EXPECT_EQ(proxy.error().message,
            "argument 0 of the reply to stop may not be a proxy: no protocol is configured for it");

  os::Status unknown = interface.checkArguments("launch", false, {});
  ASSERT_FALSE(unknown.ok());
  EXPECT_EQ(unknown.error().message, "selector launch is not in protocol Tool");
}

TEST_F(MessageInterfaceCheck, CheckArgumentsStopsAtTheFirstRefusal) {
  MessageInterface interface(tool);
  interface.setClasses({evenClass}, "run:with:", 1, false);
  os::Status status =
      interface.checkArguments("run:with:", false, {Value::string("any"), Value::integer(7)});
  ASSERT_FALSE(status.ok());
  EXPECT_EQ(status.error().message, "argument 1 of run:with: must be one of Even, not 7");
  EXPECT_TRUE(
      interface.checkArguments("run:with:", false, {Value::string("any"), Value::integer(8)}).ok());
}

}  // namespace
