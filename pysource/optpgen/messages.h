// Every message pysource.optpgen raises, in one table.
#ifndef TREELENS_OPTPGEN_MESSAGES_H
#define TREELENS_OPTPGEN_MESSAGES_H

namespace optpgen {
namespace msg {

// ParseError messages.
constexpr const char *BadInput = "bad input";
constexpr const char *BadToken = "bad token";
constexpr const char *TooMuchInput = "too much input";
constexpr const char *TooDeep = "too much nesting";
constexpr const char *NoProgress = "grammar makes no progress on token";

// Misuse of a parser or converter.
constexpr const char *NotReady =
    "Parser.setup() must be called before addtoken(), and again after an error";
constexpr const char *Busy = "Parser is busy: called again from convert()";
constexpr const char *UnknownStart = "Unknown start symbol: %ld";
constexpr const char *BadMaxDepth = "maxdepth must be between 1 and %ld";
constexpr const char *ConvertMissing =
    "%.200s does not implement convert()";

// Grammar objects that cannot be compiled (%s: the detail).
constexpr const char *BadGrammar = "Invalid grammar object: %s";

} // namespace msg
} // namespace optpgen

#endif
