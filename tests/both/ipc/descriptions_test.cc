// Interface descriptions: signatures, matching arguments, introspection, completeness.
#include <gtest/gtest.h>

#include <string>

#include "support/ipc/arguments.h"
#include "support/ipc/served.h"

namespace spacekeep::ipc {
namespace {

using enum ArgumentKind;

const InterfaceDescription kInterface = {
    "com.quorvel.Test",
    {{"first", {{"id", kString}, {"endpoint", kDescriptor}}, {{"result", kOptionalDictionary}}},
     {"second", {}, {}}}};

TEST(SignatureOf, EveryKindIsItsDbusType) {
  EXPECT_EQ(signatureOf(kInt32), "i");
  EXPECT_EQ(signatureOf(kString), "s");
  EXPECT_EQ(signatureOf(kDictionary), "a{sv}");
  EXPECT_EQ(signatureOf(kOptionalDictionary), "aa{sv}");
  EXPECT_EQ(signatureOf(kOptionalValue), "av");
  EXPECT_EQ(signatureOf(kOptionalString), "as");
  EXPECT_EQ(signatureOf(kDescriptor), "h");
}

TEST(InterfaceDescriptionMethod, IsFoundByItsExactName) {
  ASSERT_NE(kInterface.method("second"), nullptr);
  EXPECT_EQ(kInterface.method("second")->name, "second");
  EXPECT_EQ(kInterface.method("Second"), nullptr);
  EXPECT_EQ(kInterface.method(""), nullptr);
}

TEST(Matches, TakesExactlyTheDescribedKindsInOrder) {
  const std::vector<ArgumentDescription> described = {
      {"a", kInt32},         {"b", kString},         {"c", kDictionary}, {"d", kOptionalDictionary},
      {"e", kOptionalValue}, {"f", kOptionalString}, {"g", kDescriptor}};
  const Arguments good = {std::int32_t{1},      std::string("s"), Dictionary{},
                          OptionalDictionary(), OptionalValue(),  OptionalString(),
                          SharedDescriptor()};
  EXPECT_TRUE(matches(described, good));
  EXPECT_TRUE(matches({}, {}));
  for (std::size_t i = 0; i < good.size(); ++i) {
    Arguments wrong = good;
    wrong[i] = good[(i + 1) % good.size()];
    EXPECT_FALSE(matches(described, wrong)) << i;
  }
  Arguments fewer = good;
  fewer.pop_back();
  EXPECT_FALSE(matches(described, fewer));
  Arguments more = good;
  more.emplace_back(std::int32_t{1});
  EXPECT_FALSE(matches(described, more));
}

TEST(IntrospectionXml, NamesEveryMethodAndArgument) {
  EXPECT_EQ(introspectionXml(kInterface),
            "<node>\n"
            "  <interface name=\"com.quorvel.Test\">\n"
            "    <method name=\"first\">\n"
            "      <arg name=\"id\" type=\"s\" direction=\"in\"/>\n"
            "      <arg name=\"endpoint\" type=\"h\" direction=\"in\"/>\n"
            "      <arg name=\"result\" type=\"aa{sv}\" direction=\"out\"/>\n"
            "    </method>\n"
            "    <method name=\"second\">\n"
            "    </method>\n"
            "  </interface>\n"
            "  <interface name=\"org.freedesktop.DBus.Introspectable\">\n"
            "    <method name=\"Introspect\">\n"
            "      <arg name=\"xml_data\" type=\"s\" direction=\"out\"/>\n"
            "    </method>\n"
            "  </interface>\n"
            "  <interface name=\"org.freedesktop.DBus.Peer\">\n"
            "    <method name=\"Ping\"/>\n"
            "    <method name=\"GetMachineId\">\n"
            "      <arg name=\"machine_uuid\" type=\"s\" direction=\"out\"/>\n"
            "    </method>\n"
            "  </interface>\n"
            "</node>\n");
}

TEST(IntrospectionXml, EscapesNames) {
  const InterfaceDescription odd = {"a<b>&\"c", {}};
  EXPECT_NE(introspectionXml(odd).find("name=\"a&lt;b&gt;&amp;&quot;c\""), std::string::npos);
}

const InterfaceDescription kLater = {"com.quorvel.Later", {{"third", {}, {}}}};

InterfaceDescription twoInterfaces() {
  InterfaceDescription both = kInterface;
  both.beside = &kLater;
  return both;
}

TEST(IntrospectionXml, NamesTheInterfacesBesideToo) {
  const std::string xml = introspectionXml(twoInterfaces());
  EXPECT_NE(xml.find("  </interface>\n"
                     "  <interface name=\"com.quorvel.Later\">\n"
                     "    <method name=\"third\">\n"
                     "    </method>\n"
                     "  </interface>\n"
                     "  <interface name=\"org.freedesktop.DBus.Introspectable\">\n"),
            std::string::npos)
      << xml;
}

TEST(InterfacesBesideEachOther, AreFoundByMethodAndByName) {
  const InterfaceDescription both = twoInterfaces();
  EXPECT_EQ(both.having("second"), &both);
  EXPECT_EQ(both.having("third"), &kLater);
  EXPECT_EQ(both.having("fourth"), nullptr);
  EXPECT_EQ(both.named("com.quorvel.Test"), &both);
  EXPECT_EQ(both.named("com.quorvel.Later"), &kLater);
  EXPECT_EQ(both.named("com.quorvel.Never"), nullptr);
  EXPECT_EQ(both.method("third"), nullptr) << "of this interface alone";
}

ServedInterface complete() {
  ServedInterface served;
  served.description = &kInterface;
  for (const char* name : {"first", "second"}) {
    ServedMethod method;
    method.name = name;
    method.serve = [](const Arguments&, const Responder&) {};
    served.methods.push_back(method);
  }
  return served;
}

TEST(ProblemOfServedInterface, IsEmptyWithOneHandlerForEachMethod) {
  EXPECT_EQ(problemOf(complete()), "");
}

TEST(ProblemOfServedInterface, LooksAtTheInterfacesBesideToo) {
  const InterfaceDescription both = twoInterfaces();
  ServedInterface served = complete();
  served.description = &both;
  EXPECT_EQ(problemOf(served), "third is not served");
  served.methods.push_back(served.methods.front());
  served.methods.back().name = "third";
  EXPECT_EQ(problemOf(served), "");
}

TEST(ProblemOfServedInterface, NamesWhatIsWrong) {
  EXPECT_EQ(problemOf(ServedInterface{}), "no description");
  ServedInterface missing = complete();
  missing.methods.pop_back();
  EXPECT_EQ(problemOf(missing), "second is not served");
  ServedInterface twice = complete();
  twice.methods.push_back(twice.methods.front());
  EXPECT_EQ(problemOf(twice), "first is served twice");
  ServedInterface unknown = complete();
  unknown.methods.push_back(unknown.methods.front());
  unknown.methods.back().name = "third";
  EXPECT_EQ(problemOf(unknown), "third is not described");
  ServedInterface empty = complete();
  empty.methods.back().serve = nullptr;
  EXPECT_EQ(problemOf(empty), "second has no handler");
  ServedInterface narrow = complete();
  narrow.methods.back().mode = ServeMode::kLane;
  narrow.methods.back().lane_width = 0;
  EXPECT_EQ(problemOf(narrow), "second has an empty lane");
}

}  // namespace
}  // namespace spacekeep::ipc
