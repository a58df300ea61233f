#include "platform/dbus/Introspection.h"

#include "platform/dbus/Names.h"
#include "platform/dbus/ServiceCalls.h"

#include <algorithm>

namespace vela::platform::dbus {

namespace {

constexpr std::string_view kDocumentType =
    "<!DOCTYPE node PUBLIC \"-//freedesktop//DTD D-BUS Object Introspection 1.0//EN\"\n"
    " \"http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd\">\n";

std::string_view takeWord(std::string_view& words) {
    const std::size_t end = std::min(words.find(' '), words.size());
    const std::string_view word = words.substr(0, end);
    words.remove_prefix(std::min(end + 1, words.size()));
    return word;
}

void addArguments(std::string& text, std::string_view signature, std::string_view direction, std::string_view& names) {
    while (!signature.empty()) {
        const std::size_t bytes = completeTypeBytes(signature);
        ((((((text += "   <arg name=\"") += takeWord(names)) += "\" type=\"") += signature.substr(0, bytes)) +=
          "\" direction=\"") += direction) += "\"/>\n";
        signature.remove_prefix(bytes);
    }
}

void addMembers(std::string& text, std::span<const ServiceMember> members, bool object) {
    std::string_view interface;
    for (const ServiceMember& member : members) {
        if (!object && !member.everywhere) {
            continue;
        }
        if (member.interface != interface) {
            text += interface.empty() ? "" : " </interface>\n";
            interface = member.interface;
            ((text += " <interface name=\"") += interface) += "\">\n";
        }
        ((text += "  <method name=\"") += member.name) += "\">\n";
        std::string_view names = member.arguments;
        addArguments(text, member.in, "in", names);
        addArguments(text, member.out, "out", names);
        text += "  </method>\n";
    }
    text += " </interface>\n";
}

} // namespace

std::string_view childOfNode(std::string_view path) {
    const std::string_view prefix = path == "/" ? std::string_view() : path;
    if (prefix.size() >= kObjectPath.size() || kObjectPath.substr(0, prefix.size()) != prefix ||
        kObjectPath[prefix.size()] != '/') {
        return {};
    }
    const std::string_view rest = kObjectPath.substr(prefix.size() + 1);
    return rest.substr(0, rest.find('/'));
}

std::string introspectionText(std::string_view path) {
    std::string text(kDocumentType);
    if (path == kObjectPath) {
        text += "<node>\n";
        for (const auto members : {reportingMembers(), inspectionMembers(), standardMembers()}) {
            addMembers(text, members, true);
        }
        return text + "</node>\n";
    }
    const std::string_view child = childOfNode(path);
    if (child.empty()) {
        return {};
    }
    text += "<node>\n";
    addMembers(text, standardMembers(), false);
    return ((text += " <node name=\"") += child) += "\"/>\n</node>\n";
}

} // namespace vela::platform::dbus
