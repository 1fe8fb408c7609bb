// SPDX-License-Identifier: Apache-2.0
// Network interfaces, tunnels and IPv4 addresses as the kernel's routing netlink tells them.
#include "net/routeDump.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <libmnl/libmnl.h>
#include <linux/if_addr.h>
#include <linux/if_link.h>
#include <linux/if_tunnel.h>
#include <linux/rtnetlink.h>
#include <memory>

namespace veld {
namespace {

// The kernel fills messages up to this size when the reader offers it.
constexpr std::size_t kReceiveBuffer = std::size_t{32} * 1024;

// The attributes of interest by type; later ones of a type win, as in the kernel.
template <std::size_t Types> struct Attributes {
    const nlattr *of[Types] = {};

    static int store(const nlattr *attribute, void *self) {
        const auto type = mnl_attr_get_type(attribute);
        if (type < Types)
            static_cast<Attributes *>(self)->of[type] = attribute;
        return MNL_CB_OK;
    }
};

std::optional<in_addr> addressIn(const nlattr *attribute) {
    in_addr address{};
    if (attribute == nullptr || mnl_attr_get_payload_len(attribute) != sizeof address)
        return std::nullopt;
    memcpy(&address, mnl_attr_get_payload(attribute), sizeof address);
    return address;
}

// Texts in messages end with NUL or with their attribute.
std::string textIn(const nlattr *attribute) {
    const auto *const text = static_cast<const char *>(mnl_attr_get_payload(attribute));
    return {text, strnlen(text, mnl_attr_get_payload_len(attribute))};
}

std::optional<in_addr> sitLocalIn(const nlattr *linkInfo) {
    Attributes<IFLA_INFO_DATA + 1> info;
    if (linkInfo == nullptr || mnl_attr_parse_nested(linkInfo, info.store, &info) < 0)
        return std::nullopt;
    if (info.of[IFLA_INFO_KIND] == nullptr || textIn(info.of[IFLA_INFO_KIND]) != "sit" ||
        info.of[IFLA_INFO_DATA] == nullptr)
        return std::nullopt;
    Attributes<IFLA_IPTUN_LOCAL + 1> tunnel;
    if (mnl_attr_parse_nested(info.of[IFLA_INFO_DATA], tunnel.store, &tunnel) < 0)
        return std::nullopt;
    return addressIn(tunnel.of[IFLA_IPTUN_LOCAL]);
}

// Asks for all objects of a type and hands each message to `take`: 0 or an errno value.
int dumpOnce(int type, int family, mnl_cb_t take, void *result) {
    const std::unique_ptr<mnl_socket, int (*)(mnl_socket *)> socket(mnl_socket_open2(NETLINK_ROUTE, SOCK_CLOEXEC),
                                                                    mnl_socket_close);
    if (socket == nullptr || mnl_socket_bind(socket.get(), 0, MNL_SOCKET_AUTOPID) < 0)
        return errno;
    alignas(nlmsghdr) char request[MNL_ALIGN(sizeof(nlmsghdr)) + MNL_ALIGN(sizeof(ifinfomsg))];
    nlmsghdr *const header = mnl_nlmsg_put_header(request);
    header->nlmsg_type = static_cast<__u16>(type);
    header->nlmsg_flags = NLM_F_REQUEST | NLM_F_DUMP;
    const auto sequence = static_cast<unsigned int>(time(nullptr));
    header->nlmsg_seq = sequence;
    // The first byte of ifinfomsg and ifaddrmsg alike.
    static_cast<ifinfomsg *>(mnl_nlmsg_put_extra_header(header, sizeof(ifinfomsg)))->ifi_family =
        static_cast<unsigned char>(family);
    if (mnl_socket_sendto(socket.get(), header, header->nlmsg_len) < 0)
        return errno;
    std::vector<char> buffer(kReceiveBuffer);
    for (;;) {
        const ssize_t size = mnl_socket_recvfrom(socket.get(), buffer.data(), buffer.size());
        if (size < 0)
            return errno;
        const int state = mnl_cb_run(buffer.data(), static_cast<std::size_t>(size), sequence,
                                     mnl_socket_get_portid(socket.get()), take, result);
        if (state <= MNL_CB_STOP)
            return state == MNL_CB_STOP ? 0 : errno;
    }
}

template <typename Item, std::optional<Item> (*parse)(const nlmsghdr &)>
int dump(int type, int family, std::vector<Item> &items) {
    const mnl_cb_t take = [](const nlmsghdr *message, void *result) {
        if (auto item = parse(*message))
            static_cast<std::vector<Item> *>(result)->push_back(std::move(*item));
        return MNL_CB_OK;
    };
    // EINTR: a signal, or the kernel's objects changed during the dump.
    int error = EINTR;
    for (int attempt = 0; error == EINTR && attempt < 50; ++attempt) {
        items.clear();
        error = dumpOnce(type, family, take, &items);
    }
    return error;
}

}  // namespace

std::optional<Link> parseLink(const nlmsghdr &message) {
    if (message.nlmsg_type != RTM_NEWLINK || mnl_nlmsg_get_payload_len(&message) < sizeof(ifinfomsg))
        return std::nullopt;
    Attributes<IFLA_LINKINFO + 1> attributes;
    if (mnl_attr_parse(&message, sizeof(ifinfomsg), attributes.store, &attributes) < 0 ||
        attributes.of[IFLA_IFNAME] == nullptr)
        return std::nullopt;
    const auto *const header = static_cast<const ifinfomsg *>(mnl_nlmsg_get_payload(&message));
    return Link{header->ifi_index, header->ifi_flags, textIn(attributes.of[IFLA_IFNAME]),
                sitLocalIn(attributes.of[IFLA_LINKINFO])};
}

std::optional<LinkAddress> parseAddress(const nlmsghdr &message) {
    if (message.nlmsg_type != RTM_NEWADDR || mnl_nlmsg_get_payload_len(&message) < sizeof(ifaddrmsg))
        return std::nullopt;
    const auto *const header = static_cast<const ifaddrmsg *>(mnl_nlmsg_get_payload(&message));
    Attributes<IFA_LOCAL + 1> attributes;
    if (header->ifa_family != AF_INET || mnl_attr_parse(&message, sizeof(ifaddrmsg), attributes.store, &attributes) < 0)
        return std::nullopt;
    const auto local = addressIn(attributes.of[IFA_LOCAL]);
    if (!local)
        return std::nullopt;
    return LinkAddress{static_cast<int>(header->ifa_index), *local};
}

int readLinks(std::vector<Link> &links) {
    const int error = dump<Link, parseLink>(RTM_GETLINK, AF_UNSPEC, links);
    std::sort(links.begin(), links.end(), [](const Link &a, const Link &b) { return a.index < b.index; });
    return error;
}

int readAddresses(std::vector<LinkAddress> &addresses) {
    return dump<LinkAddress, parseAddress>(RTM_GETADDR, AF_INET, addresses);
}

}  // namespace veld
