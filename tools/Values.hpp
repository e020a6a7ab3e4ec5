// Typed values on the command line: their types and their texts.
#ifndef BRENIX_TOOLS_VALUES_HPP
#define BRENIX_TOOLS_VALUES_HPP

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace brenix
{

using Bytes = std::vector<unsigned char>;

/// One of the twelve element types of coder.h. What the text of a number is, and which texts are numbers, is
/// decided here: printNumber and takeElement in emit/ are the same in C.
struct ElementType {
    const char* name;
    const char* cName;   ///< in C
    const char* cFormat; ///< conversion of printf; of floating-point numbers there is none
    std::size_t size;
    bool isText;
    bool isFloating;
    void (*print)(const unsigned char* element, std::string& text); ///< appends
    bool (*parse)(std::string_view text, unsigned char* element);   ///< whether it is one
    double (*toDouble)(const unsigned char* element);
};

const std::vector<ElementType>& elementTypes();

/// Throws std::invalid_argument for a name that is none.
const ElementType& elementType(std::string_view name);

/// Appends the elements of a list with commas; in CSV they may stand in quotes. On false `wrong` is the
/// first that is not of the type.
bool parseRow(const ElementType& type, std::string_view list, Bytes& elements, std::string& wrong,
              bool isCsv = false);

/// Whether an element of a row of CSV is a number, of whatever type, or begins like one.
bool hasNumber(std::string_view list);

/// Elements as text: a char array as it stands up to its NUL, all others with commas.
std::string printElements(const ElementType& type, const Bytes& elements);

/// A text between apostrophes; those in it become `escaped`.
std::string quoted(const std::string& text, const char* escaped);

/// A text as a word of a shell's command line.
std::string shellWord(const std::string& text);

} // namespace brenix

#endif
