#include "JetStream.hpp"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <stdexcept>
#include <thread>

namespace natsio
{

namespace
{

std::string explain(natsStatus status, jsErrCode code)
{
    std::string reason = reasonOf(status);
    if (status == NATS_NO_RESPONDERS || code == JSNotEnabledErr ||
        code == JSNotEnabledForAccountErr) {
        reason += " (has the server JetStream?)";
    }
    return reason;
}

/// Whether servers may answer otherwise soon, since they are choosing one that leads or have just begun.
bool mayChange(natsStatus status, jsErrCode code)
{
    return status == NATS_TIMEOUT || status == NATS_CONNECTION_DISCONNECTED ||
           status == NATS_INSUFFICIENT_BUFFER || code == JSClusterNotAvailErr ||
           code == JSClusterNoPeersErr || code == JSClusterNotLeaderErr ||
           code == JSClusterIncompleteErr || code == JSInsufficientResourcesErr;
}

/// The time to ask for, or one of the same second before it: libnats 3.4 writes a fraction without the zeros that it
/// begins with, so that .05 becomes .5.
std::int64_t askedTime(std::int64_t wanted)
{
    constexpr std::int64_t second = 1000000000;
    const std::int64_t fraction = wanted % second;
    return fraction < second / 10 ? wanted - fraction : wanted;
}

/// Asks until there is an answer that lasts, or it is time.
template <typename Question>
natsStatus persist(Moment until, jsErrCode& code, const Question& question)
{
    while (true) {
        const auto left =
            std::chrono::duration_cast<std::chrono::milliseconds>(until - Clock::now());
        jsOptions options;
        jsOptions_Init(&options);
        options.Wait = std::clamp<std::int64_t>(left.count(), 1, 2000);
        code = {};
        const natsStatus status = question(options, code);
        if (!mayChange(status, code) || Clock::now() + std::chrono::milliseconds(100) >= until) {
            return status;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
}

std::vector<std::string> streamsOf(jsCtx* context, const std::string& subject, Moment until)
{
    jsStreamNamesList* made = nullptr;
    jsErrCode code{};
    const natsStatus status = persist(until, code, [&](jsOptions& options, jsErrCode& error) {
        options.Stream.Info.SubjectsFilter = subject.c_str();
        return js_StreamNames(&made, context, &options, &error);
    });
    const std::unique_ptr<jsStreamNamesList, Destroy<jsStreamNamesList_Destroy>> list(made);
    if (status != NATS_OK && status != NATS_NOT_FOUND) {
        throw std::runtime_error("Could not ask for the streams of " + subject + ": " +
                                 explain(status, code));
    }
    std::vector<std::string> names;
    for (int i = 0; list && i < list->Count; ++i) {
        names.emplace_back(list->List[i]);
    }
    return names;
}

std::unique_ptr<jsStreamInfo, Destroy<jsStreamInfo_Destroy>>
findOrMake(jsCtx* context, const std::string& name, const Settings& settings, Moment until)
{
    jsStreamInfo* made = nullptr;
    jsErrCode code{};
    const natsStatus status = persist(until, code, [&](jsOptions& options, jsErrCode& error) {
        natsStatus result = js_GetStreamInfo(&made, context, name.c_str(), &options, &error);
        if (result != NATS_NOT_FOUND && error != JSStreamNotFoundErr) {
            return result;
        }
        jsStreamConfig config;
        jsStreamConfig_Init(&config);
        const char* subject = settings.subject.c_str();
        config.Name = name.c_str();
        config.Subjects = &subject;
        config.SubjectsLen = 1;
        config.Replicas = settings.replicas;
        config.MaxAge = settings.maxAge;
        // The window in which repeats are known is no longer than that.
        config.Duplicates =
            settings.maxAge > 0 ? std::min(settings.maxAge, 120 * std::int64_t(1000000000)) : 0;
        config.MaxBytes = settings.maxBytes > 0 ? settings.maxBytes : -1;
        error = {};
        result = js_AddStream(&made, context, &config, &options, &error);
        return error == JSStreamNameExistErr ? NATS_TIMEOUT : result; // another one was quicker
    });
    if (status != NATS_OK) {
        throw std::runtime_error("Could not find or make stream " + name + ": " +
                                 explain(status, code));
    }
    return std::unique_ptr<jsStreamInfo, Destroy<jsStreamInfo_Destroy>>(made);
}

} // namespace

KeptStream::KeptStream(const Connection& connection, const Settings& settings)
    : name(settings.stream)
{
    const Moment until = connection.until;
    jsCtx* made = nullptr;
    jsOptions options;
    jsOptions_Init(&options);
    if (const natsStatus status = natsConnection_JetStream(&made, connection.get(), &options);
        status != NATS_OK) {
        throw std::runtime_error("Could not use JetStream: " + reasonOf(status));
    }
    context.reset(made);
    if (name.empty()) {
        const auto names = streamsOf(made, settings.subject, until);
        if (names.size() != 1) {
            throw std::runtime_error(
                (names.empty() ? "No stream has" : "More than one stream has") +
                std::string(" the subject ") + settings.subject + ": give the option Stream");
        }
        name = names.front();
    }
    const auto info = findOrMake(made, name, settings, until);
    replicas = info->Config->Replicas;
    maxMessage = std::max<std::int64_t>(info->Config->MaxMsgSize, 0);
    const auto names = streamsOf(made, settings.subject, until);
    if (std::find(names.begin(), names.end(), name) == names.end()) {
        throw std::runtime_error("Stream " + name +
                                 " is there already and does not have the subject " +
                                 settings.subject);
    }
}

Place::Place(const KeptStream& stream, const Settings& settings, Moment until)
    : name(settings.durable)
{
    using Info = std::unique_ptr<jsConsumerInfo, Destroy<jsConsumerInfo_Destroy>>;
    jsCtx* const context = stream.context.get();
    const std::string what = name.empty() ? "a place" : "the place " + name;
    natsInbox* inbox = nullptr;
    natsInbox_Create(&inbox);
    const std::unique_ptr<natsInbox, Destroy<natsInbox_Destroy>> owned(inbox);

    jsConsumerConfig config;
    jsConsumerConfig_Init(&config);
    config.AckPolicy = js_AckExplicit;
    config.AckWait = std::chrono::nanoseconds(ackWait).count();
    config.MaxAckPending = static_cast<std::int64_t>(settings.window);
    config.FilterSubject = settings.subject.c_str();
    config.DeliverSubject = inbox;
    config.Replicas = stream.replicas; // or else one that is not durable ends with its server
    if (name.empty()) {
        config.InactiveThreshold = std::chrono::nanoseconds(2 * patience).count();
    } else {
        config.Durable = name.c_str();
    }
    constexpr jsDeliverPolicy policies[] = {js_DeliverNew, js_DeliverAll, js_DeliverByStartSequence,
                                            js_DeliverByStartTime};
    config.DeliverPolicy = policies[static_cast<int>(settings.start)];
    config.OptStartSeq = settings.startIndex;
    config.OptStartTime = askedTime(settings.startTime);

    jsConsumerInfo* made = nullptr;
    jsErrCode code{};
    const natsStatus status = persist(until, code, [&](jsOptions& options, jsErrCode& error) {
        if (!name.empty()) {
            const natsStatus result = js_GetConsumerInfo(&made, context, stream.name.c_str(),
                                                         name.c_str(), &options, &error);
            if (result != NATS_NOT_FOUND && error != JSConsumerNotFoundErr) {
                // One whose program has just been killed seems to be in use for a moment.
                const bool isInUse = result == NATS_OK && made->PushBound;
                if (isInUse && Clock::now() + std::chrono::milliseconds(200) < until) {
                    jsConsumerInfo_Destroy(made);
                    made = nullptr;
                    return NATS_TIMEOUT;
                }
                return result;
            }
        }
        error = {};
        return js_AddConsumer(&made, context, stream.name.c_str(), &config, &options, &error);
    });
    Info info(made);
    if (status != NATS_OK) {
        throw std::runtime_error("Could not find or make " + what + " in stream " + stream.name +
                                 ": " + explain(status, code));
    }
    const jsConsumerConfig& found = *info->Config;
    const auto fail = [&](const std::string& why) {
        throw std::runtime_error("Durable " + name + " of stream " + stream.name + " " + why);
    };
    if (info->PushBound) {
        fail("is in use by another reader");
    }
    if (found.DeliverSubject == nullptr || found.AckPolicy != js_AckExplicit) {
        fail("was made by another program, in another way");
    }
    const std::string filter = found.FilterSubject == nullptr ? "" : found.FilterSubject;
    if (filter != settings.subject) {
        fail("is for the subject " + filter);
    }
    name = info->Name;
    subject = found.DeliverSubject;
    pending = static_cast<std::uint64_t>(std::max<std::int64_t>(info->NumAckPending, 0));
    if (found.MaxAckPending != config.MaxAckPending) {
        config.DeliverSubject = subject.c_str();
        config.DeliverPolicy = found.DeliverPolicy;
        config.OptStartSeq = found.OptStartSeq;
        config.OptStartTime = found.OptStartTime;
        jsConsumerInfo* changed = nullptr;
        const natsStatus result = persist(until, code, [&](jsOptions& options, jsErrCode& error) {
            return js_UpdateConsumer(&changed, context, stream.name.c_str(), &config, &options,
                                     &error);
        });
        info.reset(changed);
        if (result != NATS_OK) {
            fail("could not be given another Window: " + explain(result, code));
        }
    }
}

State::State(const natsMsg* answer)
{
    const char* const begin = natsMsg_GetData(answer);
    const auto json =
        nlohmann::json::parse(begin, begin + natsMsg_GetDataLength(answer), nullptr, false);
    if (!json.is_object()) {
        return;
    }
    if (const auto error = json.find("error"); error != json.end()) {
        const auto code = error->value("err_code", 0);
        isGone = code == JSStreamNotFoundErr || code == JSConsumerNotFoundErr;
        return;
    }
    isKnown = true;
    pending = json.value("num_ack_pending", std::uint64_t{0});
    if (const auto last = json.find("delivered"); last != json.end() && last->is_object()) {
        delivered = last->value("stream_seq", std::uint64_t{0});
    }
}

} // namespace natsio
