// What a writer does with a stream: its messages are kept until the stream has them.

#include "Writer.hpp"

#include <stdexcept>
#include <tuple>
#include <utility>

namespace natsio
{

namespace
{

constexpr std::int64_t storeWait = 3000;            // ms, after which a message is sent again
constexpr std::chrono::milliseconds retryWait(200); // before one is sent again that was refused

void onStored(jsCtx* /*js*/, natsMsg* message, jsPubAck* /*stored*/, jsPubAckErr* error,
              void* number)
{
    MessagePointer owned(message);
    if (const auto box = Mailbox::find(number)) {
        Event event{
            error == nullptr ? Event::Kind::Stored : Event::Kind::NotStored, std::move(owned), {}};
        if (error != nullptr) {
            event.text = error->ErrText != nullptr && *error->ErrText != '\0'
                             ? error->ErrText
                             : natsStatus_GetText(error->Err);
        }
        box->put(std::move(event));
    }
}

} // namespace

void Writer::openStream()
{
    stream.emplace(connection, settings);
    jsOptions options;
    jsOptions_Init(&options);
    options.PublishAsync.AckHandler = onStored;
    options.PublishAsync.AckHandlerClosure = mailbox->number();
    jsCtx* made = nullptr;
    if (const natsStatus status = natsConnection_JetStream(&made, connection.get(), &options);
        status != NATS_OK) {
        throw std::runtime_error("Could not use JetStream: " + reasonOf(status));
    }
    stream->context.reset(made);
}

void Writer::handleStored(Event& event)
{
    const auto found = unstored.find(event.message.get());
    if (found == unstored.end()) {
        return;
    }
    if (event.kind == Event::Kind::NotStored) {
        whyNot = event.text;
        again.push_back({std::move(event.message), Clock::now() + retryWait});
        askForStream();
        return;
    }
    unstoredBytes -= found->second.size;
    if (found->second.turn.rank == Rank::Data) {
        unstoredSeqs.erase(unstoredSeqs.find(found->second.turn.seq));
    }
    begun = true;
    unstored.erase(found);
}

void Writer::handleState(const natsMsg* answer)
{
    goneAnswers = State(answer).isGone ? goneAnswers + 1 : 0;
    if (goneAnswers >= 2) { // not of a server that has only just begun
        failure = "stream " + stream->name + " is not there any more";
    }
}

void Writer::askForStream()
{
    if (Clock::now() >= askTime) {
        askTime = Clock::now() + std::chrono::milliseconds(500);
        connection.ask("$JS.API.STREAM.INFO." + stream->name, "", "state");
    }
}

bool Writer::keep(Label::Turn turn, std::uint64_t counts, std::size_t size)
{
    natsMsg* made = nullptr;
    natsStatus status =
        natsMsg_Create(&made, settings.subject.c_str(), nullptr,
                       reinterpret_cast<const char*>(bytes.data()), static_cast<int>(size));
    MessagePointer message(made);
    const std::string& name = sender.hello().stream;
    const Label label{name.substr(name.rfind('/') + 1), turn,
                      unstoredSeqs.empty() ? sender.hello().seq : *unstoredSeqs.begin()};
    if (status == NATS_OK) {
        status = natsMsgHeader_Set(made, idHeader, label.id().c_str());
    }
    if (status == NATS_OK) {
        status = natsMsgHeader_Set(made, storedHeader, std::to_string(label.stored).c_str());
    }
    if (status != NATS_OK) {
        throw std::runtime_error("Could not make a message: " + reasonOf(status));
    }
    unstored.emplace(made, Unstored{turn, counts, size});
    unstoredBytes += size;
    if (turn.rank == Rank::Data) {
        unstoredSeqs.insert(turn.seq);
    }
    if (hand(message) != NATS_OK && message) {
        again.push_back({std::move(message), Clock::now() + retryWait});
    }
    return true;
}

/// To the library, which tells what becomes of it.
natsStatus Writer::hand(MessagePointer& message)
{
    jsPubOptions options;
    jsPubOptions_Init(&options);
    options.MaxWait = storeWait;
    options.ExpectStream = stream->name.c_str();
    natsMsg* raw = message.get();
    const natsStatus status = js_PublishMsgAsync(stream->context.get(), &raw, &options);
    if (raw == nullptr) {
        std::ignore = message.release(); // the library has it
    }
    if (status != NATS_OK) {
        whyNot = connected ? reasonOf(status) : noConnection;
    }
    return status;
}

void Writer::sendAgain()
{
    while (connected && !again.empty() && again.front().at <= Clock::now() && !mayEnd()) {
        if (hand(again.front().message) != NATS_OK && again.front().message) {
            again.front().at = Clock::now() + retryWait;
            return;
        }
        again.pop_front();
    }
}

} // namespace natsio
