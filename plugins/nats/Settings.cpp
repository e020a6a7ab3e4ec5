#include "Settings.hpp"

#include "messages/Texts.hpp"

#include <algorithm>
#include <cmath>
#include <ctime>
#include <fstream>
#include <sstream>

namespace natsio
{

namespace
{

using brenixcore::plugin::Options;

std::vector<std::string> readServers(const std::string& list)
{
    std::vector<std::string> servers;
    std::istringstream stream(list);
    for (std::string url; std::getline(stream, url, ',');) {
        url.erase(0, url.find_first_not_of(' '));
        url.erase(url.find_last_not_of(' ') + 1);
        if (url.empty() || url.find_first_of(" \t\r\n") != std::string::npos) {
            Options::fail("Servers",
                          "must be URLs such as nats://127.0.0.1:4222, separated by commas");
        }
        servers.push_back(url);
    }
    if (servers.empty()) {
        Options::fail("Servers", "must name a server");
    }
    return servers;
}

/// Tokens separated by dots. Only a reader's may be `*`, or `>` at the end.
std::string readSubject(Options& options, bool writes)
{
    const auto given = options.text("Subject");
    if (!given) {
        Options::fail("Subject", "is required");
    }
    const bool isText = messages::isUtf8(*given) &&
                        std::none_of(given->begin(), given->end(),
                                     [](char c) { return (c >= 0 && c <= ' ') || c == 0x7F; });
    const std::string dotted = "." + *given + ".";
    if (!isText || dotted.find("..") != std::string::npos || given->size() > 1000) {
        Options::fail("Subject", "must be tokens separated by dots, without spaces");
    }
    const bool hasRest = dotted.find(".>.") != std::string::npos;
    if (hasRest && dotted.find(".>.") + 3 != dotted.size()) {
        Options::fail("Subject", "may have > at its end only");
    }
    if (writes && (hasRest || dotted.find(".*.") != std::string::npos)) {
        Options::fail("Subject", "may have wildcards for reading only");
    }
    return *given;
}

/// A name of a stream or of a reader's place, which the server has in subjects and in names of files.
std::string readName(Options& options, const std::string& option)
{
    const auto given = options.text(option);
    if (given && (given->empty() || given->size() > 255 ||
                  given->find_first_of(std::string(" \t\r\n.*>/\\\0", 10)) != std::string::npos ||
                  !messages::isUtf8(*given))) {
        Options::fail(option, "must be a name without spaces and . * > / \\");
    }
    return given.value_or("");
}

std::chrono::milliseconds readSeconds(Options& options, const std::string& name, double otherwise)
{
    const double seconds = options.number(name).value_or(otherwise);
    if (!(seconds >= 0.001 && seconds <= 86400)) {
        Options::fail(name, "must be 0.001 to 86400 seconds");
    }
    return std::chrono::milliseconds(std::llround(seconds * 1000));
}

std::string readFileName(Options& options, const std::string& name)
{
    std::string file = options.text(name).value_or("");
    if (!file.empty() && !std::ifstream(file)) {
        Options::fail(name, "could not read " + file);
    }
    return file;
}

/// Such as 2026-11-25T16:52:04.5Z.
std::int64_t readTime(const std::string& text)
{
    std::tm parts{};
    const char* rest = ::strptime(text.c_str(), "%Y-%m-%dT%H:%M:%S", &parts);
    double fraction = 0;
    if (rest != nullptr && *rest == '.') {
        const std::size_t digits = std::string(rest + 1).find_first_not_of("0123456789");
        if (digits == std::string::npos || digits == 0 || digits > 9) {
            rest = nullptr;
        } else {
            fraction = std::stod(std::string(rest, digits + 1));
            rest += 1 + digits;
        }
    }
    if (rest == nullptr || std::string(rest) != "Z") {
        Options::fail("StartTime",
                      "must be a time of UTC such as 2026-01-31T12:00:00.5Z, not " + text);
    }
    return ::timegm(&parts) * 1000000000 + std::llround(fraction * 1e9);
}

void readStart(Options& options, Settings& settings)
{
    const auto start = options.text("Start");
    const std::string name = start.value_or(settings.durable.empty() ? "new" : "all");
    if (name != "new" && name != "all" && name != "index" && name != "time") {
        Options::fail("Start", "must be new, all, index or time, not " + name);
    }
    settings.start = name == "all"     ? Start::All
                     : name == "index" ? Start::Index
                     : name == "time"  ? Start::Time
                                       : Start::New;
    settings.keeps = settings.keeps || start || !settings.durable.empty();
    const auto index = options.wholeNumber("StartIndex", 1, 1L << 53);
    const auto time = options.text("StartTime");
    const auto require = [&](const char* option, bool isGiven, bool isOfUse) {
        if (isGiven != isOfUse) {
            Options::fail(option, isOfUse ? "is required for Start=" + name
                                          : "is of no use for Start=" + name);
        }
    };
    require("StartIndex", index.has_value(), settings.start == Start::Index);
    require("StartTime", time.has_value(), settings.start == Start::Time);
    settings.startIndex = static_cast<std::uint64_t>(index.value_or(0));
    settings.startTime = time ? readTime(*time) : 0;
}

/// Of a URL: without its scheme, what its owner keeps to himself, its port, and the brackets of IPv6.
std::string hostOf(const std::string& url)
{
    std::string host = publicName(url);
    const std::size_t scheme = host.find("://");
    host.erase(0, scheme == std::string::npos ? 0 : scheme + 3);
    if (host.rfind('[', 0) == 0) {
        return host.substr(1, host.find(']') - 1);
    }
    return host.substr(0, host.find(':'));
}

/// The library looks for one name only.
std::string readServerName(Options& options, const Settings& settings)
{
    if (const auto given = options.text("ServerName")) {
        if (given->empty()) {
            Options::fail("ServerName", "must not be empty");
        }
        return *given;
    }
    const std::string first = hostOf(settings.servers.front());
    const bool isOne = std::all_of(settings.servers.begin(), settings.servers.end(),
                                   [&](const std::string& url) { return hostOf(url) == first; });
    if (!isOne && settings.usesTls()) {
        Options::fail("ServerName", "is required for TLS with servers on several hosts");
    }
    return isOne ? first : "";
}

/// Options that would have no effect are mistakes.
void refuse(Options& options, const std::vector<const char*>& texts,
            const std::vector<const char*>& numbers, const std::string& why)
{
    for (const char* const name : texts) {
        if (options.text(name)) {
            Options::fail(name, why);
        }
    }
    for (const char* const name : numbers) {
        if (options.number(name)) {
            Options::fail(name, why);
        }
    }
}

} // namespace

Settings readSettings(Options& options)
{
    Settings settings;
    const std::string mode = options.text("Mode").value_or("read");
    if (mode != "read" && mode != "write") {
        Options::fail("Mode", "must be read or write, not " + mode);
    }
    settings.writes = mode == "write";
    settings.servers = readServers(options.text("Servers").value_or("nats://127.0.0.1:4222"));
    settings.subject = readSubject(options, settings.writes);
    settings.stream = readName(options, "Stream");
    settings.keeps = !settings.stream.empty();
    if (settings.writes) {
        refuse(options, {"Durable", "Start", "StartTime"}, {"StartIndex", "MaxMessage", "Writers"},
               "is for reading");
    } else {
        refuse(options, {"Name", "Unit"}, {"Rate"}, "is for writing");
        settings.durable = readName(options, "Durable");
        readStart(options, settings);
    }
    if (settings.stream.empty()) {
        refuse(options, {}, {"Replicas", "MaxAge", "MaxBytes"},
               "is of a Stream, which is not given");
    }
    if (!settings.keeps) {
        refuse(options, {}, {"Window"}, "is of no use without a Stream");
    }
    settings.replicas = options.wholeNumber("Replicas", 1, 5).value_or(1);
    if (const auto age = options.number("MaxAge")) {
        if (!(*age >= 0.1 && *age <= 1e9)) {
            Options::fail("MaxAge", "must be 0.1 to 1000000000 seconds");
        }
        settings.maxAge = std::llround(*age * 1e9);
    }
    settings.maxBytes = options.wholeNumber("MaxBytes", 1, 1L << 53).value_or(0);
    settings.window =
        static_cast<std::size_t>(options.wholeNumber("Window", 1, 65536).value_or(1000));
    settings.credentialsFile = readFileName(options, "CredentialsFile");
    settings.caFile = readFileName(options, "CaFile");
    settings.certificateFile = readFileName(options, "CertificateFile");
    settings.keyFile = readFileName(options, "KeyFile");
    if (settings.certificateFile.empty() != settings.keyFile.empty()) {
        Options::fail(settings.keyFile.empty() ? "KeyFile" : "CertificateFile",
                      "is missing: a certificate has a key");
    }
    settings.serverName = readServerName(options, settings);
    settings.connectTimeout = readSeconds(options, "ConnectTimeout", 10);
    settings.closeTimeout = readSeconds(options, "CloseTimeout", 10);
    return settings;
}

bool Settings::usesTls() const
{
    return !caFile.empty() || !certificateFile.empty() ||
           std::any_of(servers.begin(), servers.end(),
                       [](const std::string& url) { return url.rfind("tls://", 0) == 0; });
}

std::string publicName(const std::string& url)
{
    const std::size_t scheme = url.find("://");
    const std::size_t begin = scheme == std::string::npos ? 0 : scheme + 3;
    const std::size_t at = url.rfind('@');
    return at == std::string::npos || at < begin ? url
                                                 : std::string(url).erase(begin, at + 1 - begin);
}

} // namespace natsio
