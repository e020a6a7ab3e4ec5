// A connection with one of several servers.
#ifndef BRENIX_PLUGINS_NATS_CONNECTION_HPP
#define BRENIX_PLUGINS_NATS_CONNECTION_HPP

#include "Mailbox.hpp"
#include "Settings.hpp"

#include <memory>
#include <string>

namespace natsio
{

/// What a call says that has failed on this thread.
std::string reasonOf(natsStatus status);

/// What is kept for each thread that calls the library.
struct ThreadMemory {
    ThreadMemory() = default;
    ThreadMemory(const ThreadMemory&) = delete;
    ThreadMemory& operator=(const ThreadMemory&) = delete;
    ~ThreadMemory() { nats_ReleaseThreadMemory(); }
};

/// While it is there, the library connects anew by itself whenever the connection ends, and tells the mailbox.
class Connection
{
public:
    /// @throws std::runtime_error after the time of the settings; it names each server with its reason
    Connection(const Settings& settings, std::shared_ptr<Mailbox> box);

    natsConnection* get() const { return connection.get(); }

    const Moment until; ///< when open has to be done

    /// Where it goes, or went last.
    std::string server();

    /// How often it was made anew.
    std::uint64_t reconnects() const;

    /// Waits until the server has taken what was sent.
    natsStatus flush(std::int64_t milliseconds) const;

    /// Has what arrives under a subject put into the mailbox. @throws std::runtime_error
    void subscribe(const std::string& subject);

    /// Has what a server tells under a subject put into the mailbox, as an answer without a question.
    void watch(const std::string& subject);

    /// What arrives from now on is of no use.
    void unsubscribe() const { natsSubscription_Unsubscribe(subscription.get()); }

    /// Sends to a subject. Returns whether the library took it.
    bool send(const std::string& subject, const std::string& text) const;

    /// The same, for an answer, which has this word as text. @throws std::runtime_error when there is no place
    /// to answer to
    bool ask(const std::string& subject, const std::string& text, const std::string& word);

private:
    using Handle = std::unique_ptr<natsConnection, Destroy<natsConnection_Destroy>>;

    /// Connects with one of the servers. Says why not.
    std::string connect(const Settings& settings, const std::vector<std::string>& servers,
                        std::int64_t milliseconds);

    std::shared_ptr<Mailbox> mailbox;
    Handle connection;
    using Subscription = std::unique_ptr<natsSubscription, Destroy<natsSubscription_Destroy>>;

    Subscription subscribe(const std::string& subject, natsMsgHandler handler);

    Subscription subscription, answers;
    std::vector<Subscription> watches;
    std::string inbox;
    std::string lastServer;
};

} // namespace natsio

#endif
