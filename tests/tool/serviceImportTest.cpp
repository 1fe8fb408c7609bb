// SPDX-License-Identifier: Apache-2.0
// What becomes of the services of other firewall managers, as tables.
#include <gtest/gtest.h>

#include "model/numbers.h"
#include "model/serviceImport.h"

namespace veldfwctl {
namespace {

/// "web: 80/tcp | x-udp: 9/udp; lost: ...", or why it is refused or left out.
std::string outcome(const ServiceImport &import) {
    if (!import.refusal.empty()) {
        return "refused: " + import.refusal;
    }
    if (!import.precedence.empty()) {
        return "after " + import.precedence;
    }
    std::vector<std::string> parts;
    for (const ImportedDefinition &each : import.definitions) {
        parts.push_back(each.definition.name + ": " + definitionPortsText(each.definition));
    }
    return join(parts, " | ") + (import.losses.empty() ? "" : "; lost: " + join(import.losses, "; "));
}

std::vector<std::string> outcomes(const std::vector<ForeignService> &services) {
    const auto find = [&services](const std::string &name, const ForeignService &) -> const ForeignService * {
        for (const ForeignService &service : services) {
            if (service.name == name) {
                return &service;
            }
        }
        return nullptr;
    };
    std::vector<std::string> texts;
    for (const ServiceImport &import : servicesTranslate(services, find)) {
        texts.push_back(outcome(import));
    }
    return texts;
}

std::string nested(size_t depth) {
    std::string text;
    for (size_t i = 0; i < depth; ++i) {
        text += "<service>";
    }
    return text;
}

TEST(ServiceXml, IsDividedWhereOneRecordCannotHoldIt) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        // the inside of <service>, and what becomes of it
        {R"(<short>A</short><description>B</description><port port="80" protocol="tcp"/>)", "x: 80/tcp"},
        {R"(<port protocol="UDP" port="2000-1000"/><port port="1500" protocol="udp"/>)", "x: 1000-2000/udp"},
        {R"(<port port="53" protocol="tcp"/><port port="53" protocol="udp"/>)", "x: 53/tcp+udp"},
        {R"(<port port="53" protocol="tcp"/><port port="53-54" protocol="udp"/>)", "x-tcp: 53/tcp | x-udp: 53-54/udp"},
        {R"(<source-port port="5355" protocol="udp"/>)", "x: from 5355/udp"},
        {R"(<port port="80" protocol="tcp"/><source-port port="68" protocol="udp"/>)", "x: 80/tcp, from 68/udp"},
        {R"(<port port="1" protocol="tcp"/><port port="2" protocol="udp"/><source-port port="3" protocol="udp"/>)",
         "x-tcp: 1/tcp | x-udp: 2/udp, from 3/udp"},
        {R"(<protocol value="igmp"/>)", "x: igmp"},
        {R"(<protocol value="icmp"/><protocol value="ipv6-icmp"/><port port="1" protocol="tcp"/>)",
         "x-tcp: 1/tcp | x-icmp: icmp"},
        {R"(<port port="1" protocol="tcp"/><port port="1" protocol="udp"/><protocol value="2"/>)",
         "x-tcp-udp: 1/tcp+udp | x-igmp: igmp"},
        {R"(<protocol value="tcp"/>)", "x: 1-65535/tcp"},
        {R"(<port port="" protocol="udp"/>)", "x: 1-65535/udp"},
        // what is lost
        {R"(<protocol value="icmp"/>)", "x: icmp; lost: the restriction to ICMP of IPv4"},
        {R"(<port port="5" protocol="sctp"/><source-port port="6-7" protocol="dccp"/><port port="1" protocol="tcp"/>)",
         "x: 1/tcp; lost: port 5/sctp; source port 6-7/dccp"},
        {R"(<protocol value="GRE"/><helper name="pptp"/><module name="m"/><port port="1723" protocol="tcp"/>)",
         "x: 1723/tcp; lost: protocol gre (service vpn_server_pptp stands for it); connection tracking helper pptp; "
         "connection tracking module m"},
        {R"(<destination ipv4="224.0.0.251" ipv6="ff02::fb"/><port port="5353" protocol="udp"/>)",
         "x: 5353/udp; lost: the restriction to destination 224.0.0.251 and ff02::fb"},
        {R"(<ipset name="a"/><port port="1" protocol="tcp" interface="eth0"/>)",
         "x: 1/tcp; lost: <ipset>, which is not known; \"interface\" of <port>, which is not known"},
        {R"(<include service="y"/><port port="1" protocol="tcp"/>)",
         "x: 1/tcp; lost: included service y, which is not there"},
        // what is refused
        {"", "refused: d/x.xml: nothing is left of it without ports"},
        {R"(<protocol value="esp"/>)",
         "refused: d/x.xml: nothing is left of it without protocol esp (service vpn_server_ipsec stands for it)"},
        {"\n<port port=\"1\"/>", "refused: d/x.xml:2: <port> has no \"protocol\""},
        {R"(<port port="0" protocol="tcp"/>)",
         "refused: d/x.xml:1: \"0\" is no port or range of ports from 1 to 65535"},
        {R"(<port port="1-2-3" protocol="tcp"/>)",
         "refused: d/x.xml:1: \"1-2-3\" is no port or range of ports from 1 to "
         "65535"},
        {R"(<port port="65536" protocol="tcp"/>)",
         "refused: d/x.xml:1: \"65536\" is no port or range of ports from 1 to 65535"},
        {R"(<source-port port="" protocol="tcp"/>)",
         "refused: d/x.xml:1: \"\" is no port or range of ports from 1 to 65535"},
        {R"(<port port="1" protocol="any"/>)", "refused: d/x.xml:1: \"any\" is no protocol with ports"},
        {"\n\n<port>", "refused: d/x.xml:3: no valid XML (mismatched element)"},
    };
    for (const auto &[inside, expected] : cases) {
        const std::string text = R"(<?xml version="1.0"?><service version="1">)" + inside + "</service>";
        EXPECT_EQ(expected, outcomes({serviceXmlParse("d/x.xml", text)}).front()) << inside;
    }
}

TEST(ServiceXml, RefusesHostileDocumentsByLine) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"", "1: no valid XML (empty document)"},
        {"<!-- nothing -->", "1: there is no element in it"},
        {"<zone/>", "1: <zone> is no service"},
        {"<service/>\n<service/>", "2: there is something after the end of <service>"},
        {"<!DOCTYPE service [<!ENTITY p '80'>]>\n<service><port port='&p;' protocol='tcp'/></service>",
         "2: \"&p;\" is no port or range of ports from 1 to 65535"},
        {nested(100000), "1: no valid XML (element depth exceeded)"},
        {std::string("<service>\n\xff\xfe\x01"), "2: no valid XML (parsing text)"},
    };
    for (const auto &[text, expected] : cases) {
        EXPECT_EQ("d/x.xml:" + expected, serviceXmlParse("d/x.xml", text).error) << text.substr(0, 100);
    }
}

TEST(ApplicationProfiles, LeaveEachOtherAlone) {
    const std::vector<std::pair<std::string, std::vector<std::string>>> cases = {
        {"[A]\ntitle=T\ndescription=D\nports=137,138/udp|139,445/tcp\n", {"A-tcp: 139,445/tcp | A-udp: 137-138/udp"}},
        {"\xEF\xBB\xBF[Web Full+]\r\nports = 53\r\n", {"Web-Full+: 53/tcp+udp"}},
        {"# c\n; c\n[A]\ndescription: more\n  ports=1/tcp\nPorts: 6000:6010/tcp\n\t| 7/tcp\n", {"A: 7,6000-6010/tcp"}},
        {"[A]\nports=80/tcp\nicon=a.png\n", {"A: 80/tcp; lost: \"icon\", which is not known"}},
        {"[A]\nports=80,443\n[B]\nports=1/tcp\n",
         {"refused: f:2: \"80,443\" has several ports and no protocol", "B: 1/tcp"}},
        {"[A]\nports=1/tcp\nwhat\n[B]\nports=1/gre\n[C]\nports=1/tcp|\n[D]\nports=1/tcp/udp",
         {"refused: f:3: \"what\" is not \"key=value\"", "refused: f:5: \"gre\" is no protocol with ports",
          "refused: f:7: \"\" is no port or range of ports from 1 to 65535",
          "refused: f:9: \"1/tcp/udp\" has more than one protocol"}},
        {"[A]\ntitle=T\n[A]\nports=1/tcp\n[B\nports=1/tcp\n[B]\nports=1/tcp\nports=2/tcp",
         {"refused: f:1: profile \"A\" has no ports", "refused: f:3: profile \"A\" is there twice",
          "refused: f:5: \"[\" without \"]\"", "refused: f:9: \"ports\" is there twice"}},
        {"{\"name\": \"x\"}\nports=1/tcp\n", {"refused: f:1: neither XML nor a profile \"[Name]\""}},
        {"[../!]\nports=1/tcp\n[!]\nports=1/tcp\n[a/b,c]\nports=1/tcp\n[a b c]\nports=1/tcp",
         {"refused: f: \"../!\" has no letter or digit to make a name of",
          "refused: f: \"!\" has no letter or digit to make a name of", "a-b-c: 1/tcp",
          "refused: f: the name it would have here is that of \"a/b,c\" in f"}},
        {"", {}},
    };
    for (const auto &[text, expected] : cases) {
        EXPECT_EQ(expected, outcomes(applicationProfilesParse("f", text))) << text;
    }
}

TEST(Includes, AreFollowedRoundInCirclesOnce) {
    const auto xml = [](const std::string &name, const std::string &inside) {
        return serviceXmlParse("d/" + name + ".xml", "<service>" + inside + "</service>");
    };
    const std::vector<std::string> expected = {"a: 1-3/tcp; lost: c: connection tracking helper h",
                                               "b: 1-3/tcp; lost: c: connection tracking helper h",
                                               "c: 1-3/tcp; lost: connection tracking helper h",
                                               "after d/a.xml",
                                               "d: 9/tcp; lost: included service e (d/e.xml:1: <port> has no \"port\")",
                                               "refused: d/e.xml:1: <port> has no \"port\""};
    EXPECT_EQ(expected,
              outcomes({xml("a", R"(<include service="b"/><port port="1" protocol="tcp"/>)"),
                        xml("b", R"(<include service="c"/><port port="2" protocol="tcp"/>)"),
                        xml("c", R"(<include service="a"/><helper name="h"/><port port="3" protocol="tcp"/>)"),
                        xml("a", R"(<port port="7" protocol="tcp"/>)"),
                        xml("d", R"(<include service="e"/><port port="9" protocol="tcp"/>)"), xml("e", "<port/>")}));
}

TEST(PartsOfServices, ShareNamesOnlyWithTheSame) {
    const std::vector<std::string> expected = {"x-tcp: 1/tcp | x-udp2: 2/udp", "x-tcp: 1/tcp", "x-udp: 3/udp"};
    EXPECT_EQ(expected, outcomes(applicationProfilesParse(
                            "f", "[x]\nports=1/tcp|2/udp\n[x-tcp]\nports=1/tcp\n[x-udp]\nports=3/udp\n")));
}

TEST(ImportCompare, ReplacesNothingUnasked) {
    const auto find = [](const std::string &, const ForeignService &) { return nullptr; };
    const std::vector<ForeignService> services = applicationProfilesParse(
        "f", "[new]\nports=1/tcp\n[same]\nports=2,3/tcp\n[other]\nports=4/tcp\n[half]\nports=5/tcp|6/udp\n");
    const auto existing = [](const std::string &name) -> std::optional<ServiceDefinition> {
        const std::map<std::string, std::vector<std::string>> known = {
            {"same", {"3", "2"}}, {"other", {"4", "5"}}, {"half-udp", {"7"}}};
        const auto found = known.find(name);
        return found == known.end() ? std::nullopt
                                    : std::optional<ServiceDefinition>({name, 1, {}, 1, portSet(found->second)});
    };
    const std::vector<std::pair<bool, std::string>> cases = {
        {false,
         "0 . 1 . 2 service other is there as 4-5/tcp; --replace makes it 4/tcp. 02 service half-udp is there as "
         "7/tcp; --replace makes it 6/udp. "},
        {true, "0 . 1 . 2 . 02 . "},
    };
    for (const auto &[mayReplace, expected] : cases) {
        std::vector<ServiceImport> imports = servicesTranslate(services, find);
        importCompare(imports, existing, mayReplace);
        std::string text;
        for (const ServiceImport &import : imports) {
            for (const ImportedDefinition &each : import.definitions) {
                text += std::to_string(static_cast<int>(each.state));
            }
            text += " " + import.refusal + ". ";
        }
        EXPECT_EQ(expected, text);
    }
}

}  // namespace
}  // namespace veldfwctl
