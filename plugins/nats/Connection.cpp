#include "Connection.hpp"

#include <algorithm>
#include <array>
#include <stdexcept>

namespace natsio
{

namespace
{

constexpr std::int64_t writeDeadline = 3000; // ms; docs/plugins.md tells

void put(void* number, Event::Kind kind, const std::string& text, natsMsg* message = nullptr)
{
    MessagePointer owned(message);
    if (const auto box = Mailbox::find(number)) {
        box->put({kind, std::move(owned), text});
    }
}

std::string lastErrorOf(natsConnection* connection)
{
    const char* text = nullptr;
    const natsStatus status = natsConnection_GetLastError(connection, &text);
    if (status == NATS_OK) {
        return "the server ended it";
    }
    return text != nullptr && *text != '\0' ? text : natsStatus_GetText(status);
}

void onMessage(natsConnection* /*nc*/, natsSubscription* /*sub*/, natsMsg* message, void* number)
{
    put(number, Event::Kind::Message, {}, message);
}

void onAnswer(natsConnection* /*nc*/, natsSubscription* /*sub*/, natsMsg* message, void* number)
{
    const std::string subject = natsMsg_GetSubject(message);
    put(number, Event::Kind::Answer, subject.substr(subject.rfind('.') + 1), message);
}

void onError(natsConnection* connection, natsSubscription* /*sub*/, natsStatus status, void* number)
{
    if (status ==
        NATS_NOT_PERMITTED) { // any other is followed by the end of the connection, or by a gap
        put(number, Event::Kind::Error, lastErrorOf(connection));
    }
}

template <Event::Kind kind>
void onChange(natsConnection* connection, void* number)
{
    put(number, kind, kind == Event::Kind::Reconnected ? std::string() : lastErrorOf(connection));
}

using OptionsHandle = std::unique_ptr<natsOptions, Destroy<natsOptions_Destroy>>;

void require(natsStatus status, const std::string& what)
{
    if (status != NATS_OK) {
        throw std::runtime_error(what + ": " + reasonOf(status));
    }
}

OptionsHandle makeOptions(const Settings& settings, const std::vector<std::string>& servers,
                          std::int64_t milliseconds, void* number)
{
    natsOptions* made = nullptr;
    require(natsOptions_Create(&made), "Could not begin");
    OptionsHandle options(made);
    std::vector<const char*> urls;
    urls.reserve(servers.size());
    for (const std::string& url : servers) {
        urls.push_back(url.c_str());
    }
    if (natsOptions_SetServers(made, urls.data(), static_cast<int>(urls.size())) != NATS_OK) {
        throw std::runtime_error("it is no URL of a server");
    }
    natsOptions_SetNoRandomize(made, true);
    natsOptions_SetTimeout(made, milliseconds);
    natsOptions_SetName(made, "brenixcoder");
    natsOptions_SetMaxReconnect(made, -1);
    natsOptions_SetReconnectWait(made, 200);
    natsOptions_SetReconnectJitter(made, 50, 50);
    natsOptions_SetReconnectBufSize(made, 1); // what finds no connection stays with the device
    natsOptions_SetPingInterval(made, 5000);
    natsOptions_SetMaxPingsOut(made, 2);
    natsOptions_SetWriteDeadline(made, writeDeadline);
    natsOptions_SetDisconnectedCB(made, onChange<Event::Kind::Disconnected>, number);
    natsOptions_SetReconnectedCB(made, onChange<Event::Kind::Reconnected>, number);
    natsOptions_SetClosedCB(made, onChange<Event::Kind::Closed>, number);
    natsOptions_SetErrorHandler(made, onError, number);
    const auto useFile = [](const char* option, const std::string& file, natsStatus status) {
        if (status != NATS_OK) {
            throw std::runtime_error(std::string("Option ") + option + ": could not use " + file +
                                     ": " + reasonOf(status));
        }
    };
    if (settings.usesTls()) {
        require(natsOptions_SetSecure(made, true), "Could not use TLS");
    }
    if (!settings.serverName.empty()) {
        require(natsOptions_SetExpectedHostname(made, settings.serverName.c_str()),
                "Could not use the server's name");
    }
    if (!settings.caFile.empty()) {
        useFile("CaFile", settings.caFile,
                natsOptions_LoadCATrustedCertificates(made, settings.caFile.c_str()));
    }
    if (!settings.certificateFile.empty()) {
        useFile("CertificateFile", settings.certificateFile,
                natsOptions_LoadCertificatesChain(made, settings.certificateFile.c_str(),
                                                  settings.keyFile.c_str()));
    }
    if (!settings.credentialsFile.empty()) {
        useFile("CredentialsFile", settings.credentialsFile,
                natsOptions_SetUserCredentialsFromFiles(made, settings.credentialsFile.c_str(),
                                                        nullptr));
    }
    return options;
}

} // namespace

std::string reasonOf(natsStatus status)
{
    natsStatus last = NATS_OK;
    const char* const text = nats_GetLastError(&last);
    std::string reason =
        last == status && text != nullptr && *text != '\0' ? text : natsStatus_GetText(status);
    const std::size_t place = reason.find("): "); // in the library's sources, which stands first
    return reason.rfind('(', 0) == 0 && place != std::string::npos ? reason.substr(place + 3)
                                                                   : reason;
}

Connection::Connection(const Settings& settings, std::shared_ptr<Mailbox> box)
    : until(Clock::now() + settings.connectTimeout), mailbox(std::move(box))
{
    const auto& servers = settings.servers;
    const auto count = static_cast<std::int64_t>(servers.size());
    const std::int64_t all = settings.connectTimeout.count();
    // Of several, the library keeps the reason of one only: then each is asked for its own.
    const std::int64_t each = std::max<std::int64_t>(1, count == 1 ? all : all / (2 * count));
    std::string reason = connect(settings, servers, each);
    if (reason.empty()) {
        server();
        return;
    }
    std::string text;
    for (const std::string& server : servers) {
        if (count > 1) {
            reason = connect(settings, {server}, each);
            connection.reset();
        }
        text += (text.empty() ? "" : "; ") + publicName(server) + ": " +
                (reason.empty() ? "it has come back by now" : reason);
    }
    throw std::runtime_error("Could not connect to " + text);
}

std::string Connection::connect(const Settings& settings, const std::vector<std::string>& servers,
                                std::int64_t milliseconds)
{
    const OptionsHandle options = makeOptions(settings, servers, milliseconds, mailbox->number());
    natsConnection* made = nullptr;
    const natsStatus status = natsConnection_Connect(&made, options.get());
    connection.reset(made);
    if (status == NATS_OK) {
        return {};
    }
    std::string reason = reasonOf(status);
    if (status == NATS_NO_SERVER) {
        return "no server answers there";
    }
    if (reason == "Expected 'PONG', got ''") {
        return settings.usesTls()
                   ? "the server ended the connection, as it does if a certificate is missing or "
                     "not good; its log says why"
                   : "the server ended the connection";
    }
    return reason;
}

std::string Connection::server()
{
    std::array<char, 1024> url{};
    if (natsConnection_GetConnectedUrl(get(), url.data(), url.size()) == NATS_OK &&
        url[0] != '\0') {
        lastServer = publicName(url.data());
    }
    return lastServer;
}

std::uint64_t Connection::reconnects() const
{
    natsStatistics* made = nullptr;
    if (natsStatistics_Create(&made) != NATS_OK) {
        return 0;
    }
    const std::unique_ptr<natsStatistics, Destroy<natsStatistics_Destroy>> statistics(made);
    std::uint64_t times = 0;
    natsConnection_GetStats(get(), made);
    natsStatistics_GetCounts(made, nullptr, nullptr, nullptr, nullptr, &times);
    return times;
}

natsStatus Connection::flush(std::int64_t milliseconds) const
{
    // When it fails to send, the library says that all went well, and has the error of the thread only.
    nats_ReleaseThreadMemory();
    natsStatus status = natsConnection_FlushTimeout(get(), milliseconds);
    if (status == NATS_OK) {
        nats_GetLastError(&status);
    }
    return status;
}

Connection::Subscription Connection::subscribe(const std::string& subject, natsMsgHandler handler)
{
    natsSubscription* made = nullptr;
    require(natsConnection_Subscribe(&made, get(), subject.c_str(), handler, mailbox->number()),
            "Could not subscribe to " + subject);
    natsSubscription_SetPendingLimits(made, -1, -1); // the mailbox has one
    return Subscription(made);
}

void Connection::subscribe(const std::string& subject)
{
    subscription = subscribe(subject, onMessage);
}

void Connection::watch(const std::string& subject)
{
    watches.push_back(subscribe(subject, onAnswer));
}

bool Connection::send(const std::string& subject, const std::string& text) const
{
    return natsConnection_PublishString(get(), subject.c_str(), text.c_str()) == NATS_OK;
}

bool Connection::ask(const std::string& subject, const std::string& text, const std::string& word)
{
    if (!answers) {
        natsInbox* name = nullptr;
        require(natsInbox_Create(&name), "Could not ask");
        inbox = name;
        natsInbox_Destroy(name);
        answers = subscribe(inbox + ".*", onAnswer);
    }
    return natsConnection_PublishRequestString(get(), subject.c_str(), (inbox + "." + word).c_str(),
                                               text.c_str()) == NATS_OK;
}

} // namespace natsio
