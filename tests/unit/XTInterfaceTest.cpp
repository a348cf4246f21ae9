#include "Extora/XTInterface.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <future>

#include "Extora/XTPlugInConnection.h"
#include "platform/interfaces/InterfaceRegistry.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"

namespace extora {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::InterfaceDescription;
using platform::Value;
using Side = InterfaceDescription::Side;
using Lines = std::vector<std::string>;

constexpr const char* kMissing =
    "unable to locate protocol \"none\" - check that it is defined and not inadvertently optimized away";

// The interface that arguments are bound to.
const auto kSink = defineInterface("com.example.sink", {{"put", "request:0:{String}"}});

std::string textOf(const std::optional<Error>& error) {
  return error ? std::to_string(error->code) + " " + error->localizedDescription() : "";
}

TEST(XTInterfaceTest, SpecificationsRestrictAndBindUntilTheFirstFault) {
  InterfaceDescription described("com.example.filter");
  const auto apply = [&](const std::string& text) { return textOf(applyInterfaceSpec(described, "filter", text)); };
  const auto fault = [&](Side side, const Value& arguments) {
    return described.faultOf("filter", side, arguments).value_or("");
  };
  EXPECT_EQ(fault(Side::Request, Array{}), "the interface com.example.filter has no operation \"filter\"");
  EXPECT_EQ(apply("request:0:{String+Data},reply:1:com.example.sink"), "");
  EXPECT_EQ(fault(Side::Request, Array{"text", 7}), "");
  EXPECT_EQ(fault(Side::Request, Array{Value::data({1})}), "");
  EXPECT_EQ(fault(Side::Request, Array{true}), "argument 0 of \"filter\" is of class Boolean, not Data or String");
  EXPECT_EQ(fault(Side::Request, Array{}), "argument 0 of \"filter\" is missing");
  EXPECT_EQ(fault(Side::Request, "text"), "the arguments of \"filter\" are no array");
  const auto invocation = [](const Value& argument) {
    return Array{1, Dictionary{{"operation", std::string("put")}, {"arguments", Array{argument}}}};
  };
  EXPECT_EQ(fault(Side::Reply, invocation("x")), "");
  EXPECT_EQ(fault(Side::Reply, invocation(7)),
            "reply argument 1 of \"filter\" is no invocation: argument 0 of \"put\" is of class Number, not String");
  EXPECT_EQ(fault(Side::Reply, Array{1, "put"}),
            "reply argument 1 of \"filter\" is no invocation: it names no operation");

  tests::LogCapture log;
  EXPECT_EQ(apply("request:0"), "6 request:0");
  EXPECT_EQ(apply("request:0:{Date},request:1:{A}:"), "6 request:0:{Date},request:1:{A}:");
  EXPECT_EQ(fault(Side::Request, Array{"text"}), "argument 0 of \"filter\" is of class String, not Date")
      << "what came before the fault is applied";
  EXPECT_EQ(apply("answer:0:com.example.sink"), "6 answer");
  EXPECT_EQ(apply("request:0:{String"), "6 {String");
  EXPECT_EQ(apply("request:0:{String+Text}"), "6 Text");
  EXPECT_EQ(apply("request:0:{}"), "6 ");
  EXPECT_EQ(log.take(), Lines());
  EXPECT_EQ(apply("request:0:none"), "6 none");
  EXPECT_EQ(log.take(), Lines{std::string("DEFAULT ops: ") + kMissing});
  EXPECT_EQ(apply("request:12x:{UUID},request:x:{Number}"), "");
  EXPECT_EQ(fault(Side::Request, Array{true}), "argument 12 of \"filter\" is missing");
  EXPECT_EQ(apply("request:99999999999999999999:{Date}"), "");
}

TEST(XTInterfaceTest, CompoundsOfferWhatTheirPartsOfferAndAreMadeOnce) {
  ASSERT_NE(defineInterface("com.example.a", {{"one", ""}}), nullptr);
  ASSERT_NE(defineInterface("com.example.b", {{"two", "request:0:{Number}"}}), nullptr);
  const Array both{"com.example.a", "com.example.b"};
  const auto compound = compoundInterface(both);
  ASSERT_NE(compound, nullptr);
  EXPECT_EQ(compound->name(), "__XX_COMPOUND__com.example.a__com.example.b");
  EXPECT_TRUE(compound->offers("one") && !compound->faultOf("two", Side::Request, Array{true}));
  EXPECT_TRUE(compound->faultOf("two", Side::Request, Array{"2"}));
  EXPECT_FALSE(compound->offers("three"));
  EXPECT_EQ(compoundInterface(both), compound);
  EXPECT_EQ(lookUpInterface(compound->name()), compound);
  EXPECT_EQ(compoundInterface("com.example.a"), lookUpInterface("com.example.a"));

  tests::LogCapture log;
  for (int times = 0; times < 2; ++times) {  // a discarded one leaves its name free
    Error error;
    EXPECT_EQ(compoundInterface(Array{"com.example.a", "none"}, &error), nullptr);
    EXPECT_EQ(textOf(error), std::string("12 ") + kMissing);
    EXPECT_EQ(log.take(), Lines{std::string("DEFAULT ops: ") + kMissing});
  }
  Error error;
  EXPECT_EQ(compoundInterface(Array{7}, &error), nullptr);
  EXPECT_EQ(compoundInterface(Value(), &error), nullptr);
  EXPECT_EQ(error, Error());
  const auto unfinished = platform::InterfaceRegistry::shared().create("__XX_COMPOUND__com.example.b");
  EXPECT_EQ(compoundInterface(Array{"com.example.b"}, &error), nullptr);
  EXPECT_EQ(textOf(error), "12 unable to create compound protocol");
}

// A host and a plug-in in one process.
TEST(XTPlugInConnectionTest, OnlyWhatFitsTheInterfacesReachesCode) {
  const auto interface =
      defineInterface("com.example.greeter",
                      {{"greet", "request:0:{String},reply:0:{String}"}, {"fail", ""}, {"lie", "reply:0:{Number}"}});
  ASSERT_NE(interface, nullptr);
  std::array<int, 2> ends{};
  ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
  ::setenv("EXTORA_IPC_FD", std::to_string(ends[1]).c_str(), 1);
  const platform::SerialQueue hostQueue("host");
  const platform::SerialQueue plugInQueue("plug-in");
  const auto host = XTPlugInConnection::initWithSocket(platform::UniqueFd(ends[0]), hostQueue);
  auto plugIn = XTPlugInConnection::initForPlugIn(plugInQueue);
  ASSERT_NE(plugIn, nullptr);
  EXPECT_EQ(XTPlugInConnection::initForPlugIn(plugInQueue), nullptr) << "a second one";
  Lines served;
  plugIn->exportInterface(interface, [&](const std::string& operation, const Array& arguments) {
    served.push_back(operation);
    XTPlugInConnection::Answer answer;
    if (operation == "fail") answer.error = Error{"POSIX", 5, "broken"};
    if (operation == "greet") answer.arguments = Array{"Hello, " + arguments[0].string()};
    if (operation == "lie") answer.arguments = Array{"no number"};
    return answer;
  });
  std::promise<void> hostGone;
  plugIn->setEndHandler([&] { hostGone.set_value(); });
  host->resume();
  plugIn->resume();
  const auto said = [](const XTPlugInConnection::Answer& answer) {
    return answer.error ? textOf(answer.error) : Value(answer.arguments).describe();
  };
  for (const bool knows : {false, true}) {
    SCOPED_TRACE(knows);
    served.clear();
    if (knows) host->setRemoteInterface(interface);
    EXPECT_EQ(said(host->call("greet", Array{"you"})), "[\"Hello, you\"]");
    EXPECT_EQ(said(host->call("greet", Array{7})), "6 argument 0 of \"greet\" is of class Number, not String");
    EXPECT_EQ(said(host->call("sing")), "6 the interface com.example.greeter has no operation \"sing\"");
    EXPECT_EQ(said(host->call("fail")), "5 broken");
    EXPECT_EQ(said(host->call("lie")),
              knows ? "6 reply argument 0 of \"lie\" is of class String, not Number" : "[\"no number\"]");
    EXPECT_EQ(served, Lines({"greet", "fail", "lie"})) << "nothing else reached the receiver";
  }
  EXPECT_EQ(said(plugIn->call("greet")), "6 nothing is offered on this side of the connection");
  std::promise<std::string> later;
  host->callAsync("greet", Array{"all"}, [&](const auto& answer) { later.set_value(said(answer)); });
  EXPECT_EQ(later.get_future().get(), "[\"Hello, all\"]");
  host->cancel();
  hostGone.get_future().wait();
  EXPECT_TRUE(said(host->call("greet", Array{"you"})).starts_with("4 "));
  plugIn.reset();
  plugInQueue.sync([] {});
  hostQueue.sync([] {});
}

}  // namespace
}  // namespace extora
