#include "Keys.hpp"

#include "Zmq.hpp"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string_view>
#include <system_error>
#include <utility>

namespace zeromq
{

namespace
{

constexpr std::size_t keyBytes = 32;
constexpr std::size_t keyLetters = 40;
constexpr std::string_view secretLabel = "secret ";

using KeyLetters = std::array<char, keyLetters + 1>;

[[noreturn]] void failAsErrno(const std::string& name)
{
    throw std::runtime_error(name + ": " + std::generic_category().message(errno));
}

bool isKey(const std::string& text)
{
    std::array<unsigned char, keyBytes> bytes{};
    return text.size() == keyLetters && zmq_z85_decode(bytes.data(), text.c_str()) != nullptr;
}

/// A file that is new.
class NewFile
{
public:
    NewFile(std::string fileName, mode_t mode)
        : name(std::move(fileName)),
          handle(::open(name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode))
    {
        if (handle == -1) {
            failAsErrno(name);
        }
    }
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;
    ~NewFile()
    {
        ::close(handle);
        if (!isKept) {
            ::unlink(name.c_str());
        }
    }

    void write(const std::string& text)
    {
        errno = ENOSPC; // what a part of it means
        if (::write(handle, text.data(), text.size()) != static_cast<ssize_t>(text.size()) ||
            ::fsync(handle) != 0) {
            failAsErrno(name);
        }
    }
    void keep() { isKept = true; }

private:
    const std::string name;
    const int handle;
    bool isKept = false;
};

/// The lines of a file that are no comments, each with its place.
template <typename Take>
void readLines(const std::string& name, std::istream& stream, const Take& take)
{
    std::string line;
    for (int number = 1; std::getline(stream, line); ++number) {
        const std::size_t end = line.find_last_not_of(" \t\r");
        line.resize(end == std::string::npos ? 0 : end + 1);
        if (!line.empty() && line[0] != '#') { // as no key begins
            take(line, name + ":" + std::to_string(number));
        }
    }
    if (stream.bad()) {
        failAsErrno(name);
    }
}

std::ifstream openFile(const std::string& name)
{
    std::ifstream file(name);
    if (!file || file.peek() == std::ifstream::traits_type::eof()) {
        // Also for a folder, which can be opened and not read.
        struct stat status {
        };
        if (!file || ::stat(name.c_str(), &status) != 0 || S_ISDIR(status.st_mode)) {
            errno = file ? EISDIR : errno;
            failAsErrno(name);
        }
    }
    return file;
}

} // namespace

std::string keyText(const std::string& bytes)
{
    KeyLetters letters{};
    if (bytes.size() != keyBytes) {
        return "of another length";
    }
    zmq_z85_encode(letters.data(), reinterpret_cast<const unsigned char*>(bytes.data()), keyBytes);
    return letters.data();
}

KeyPair makeKeys(const std::string& name)
{
    KeyLetters publicKey{};
    KeyLetters secretKey{};
    if (zmq_curve_keypair(publicKey.data(), secretKey.data()) != 0) {
        fail("Could not make keys");
    }
    KeyPair pair{publicKey.data(), secretKey.data()};
    constexpr mode_t forOwner = S_IRUSR | S_IWUSR;
    NewFile secretFile(name, forOwner);
    NewFile publicFile(name + ".pub", forOwner | S_IRGRP | S_IROTH);
    secretFile.write("# A key of CURVE. Whoever has this file is taken for its owner.\npublic " +
                     pair.publicKey + "\n" + std::string(secretLabel) + pair.secretKey + "\n");
    publicFile.write(pair.publicKey + "\n");
    secretFile.keep();
    publicFile.keep();
    return pair;
}

KeyPair readSecretKey(const std::string& name)
{
    struct stat status {
    };
    if (::stat(name.c_str(), &status) != 0) {
        failAsErrno(name);
    }
    if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
        throw std::runtime_error(name + ": others than its owner may use it; chmod 600 it");
    }
    KeyPair pair;
    auto file = openFile(name);
    readLines(name, file, [&](const std::string& line, const std::string& place) {
        if (line.rfind(secretLabel, 0) == 0) {
            pair.secretKey = line.substr(secretLabel.size());
        } else if (line.rfind("public ", 0) != 0) {
            throw std::runtime_error(place + ": is no line of a secret key");
        }
    });
    KeyLetters publicKey{};
    if (!isKey(pair.secretKey) || zmq_curve_public(publicKey.data(), pair.secretKey.c_str()) != 0) {
        throw std::runtime_error(name + ": has no secret key");
    }
    pair.publicKey = publicKey.data();
    return pair;
}

std::set<std::string> readPublicKeys(const std::string& name)
{
    std::set<std::string> keys;
    auto file = openFile(name);
    readLines(name, file, [&](const std::string& line, const std::string& place) {
        std::istringstream words(line);
        std::string key;
        std::string comment;
        words >> key >> comment;
        if (!isKey(key) || (!comment.empty() && comment[0] != '#')) {
            throw std::runtime_error(place + ": is no public key");
        }
        keys.insert(key);
    });
    return keys;
}

std::string readPublicKey(const std::string& name)
{
    const auto keys = readPublicKeys(name);
    if (keys.size() != 1) {
        throw std::runtime_error(name + ": must have one public key, and has " +
                                 std::to_string(keys.size()));
    }
    return *keys.begin();
}

} // namespace zeromq
