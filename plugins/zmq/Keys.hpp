// Keys of CURVE in files, as text of 40 characters (Z85).
#ifndef BRENIX_PLUGINS_ZMQ_KEYS_HPP
#define BRENIX_PLUGINS_ZMQ_KEYS_HPP

#include <set>
#include <string>

namespace zeromq
{

struct KeyPair {
    std::string publicKey;
    std::string secretKey;
};

/// Makes a pair and writes it to two new files: that of the name, which its owner alone can read, and the
/// public key to name.pub. Throws when there is one of them, and then leaves none.
KeyPair makeKeys(const std::string& name);

/// Reads what makeKeys() wrote. Throws when others can read it, too.
KeyPair readSecretKey(const std::string& name);

/// Reads public keys, one a line. What begins with # is a comment.
std::set<std::string> readPublicKeys(const std::string& name);

/// Reads a file of one public key.
std::string readPublicKey(const std::string& name);

/// From the bytes of a key.
std::string keyText(const std::string& bytes);

} // namespace zeromq

#endif
