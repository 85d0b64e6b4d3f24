// Uri: splits the text given to open (and to start of recording) into scheme,
// authority, path, fragment and a map of query parameters.
//
// The grammar is the player's own and deliberately not RFC 3986: clients build
// their URIs to match it, so its quirks are part of the contract:
//  - the scheme is the text before the first ':' with its case kept;
//  - the path must start with '/'; for the scheme "FILE" (exact case) the path
//    keeps that '/' and loses its last character, for any other scheme it loses
//    the '/' and keeps the last character;
//  - every query item ends with ';' (text after the last ';' is ignored), the
//    first '=' splits key and value, leading spaces of the key are dropped, the
//    first occurrence of a key wins, '&' is an ordinary character, and nothing is
//    percent-decoded.
//
// A Uri is built only by Uri::parse and is read-only afterwards; the members are
// public because the service and the recorder read them directly.
#pragma once

#include <cstddef>
#include <map>
#include <string>

namespace TavoPlayer {

class Uri {
public:
    static constexpr size_t npos = static_cast<size_t>(-1);

    // A new object owned by the caller, or null (with one error line logged) when
    // the text has no ':', its path does not start with '/', or a query item has
    // no '='.
    static Uri* parse(const char* text);

    // Index of the first ':'.
    size_t mSchemeSeparator;
    // Index of the '#' found by the fragment step, or npos.
    size_t mFragmentPos;
    // Index of the '?' found by the query step, or npos.
    size_t mQueryPos;
    std::string mUri;
    std::string mScheme;
    std::string mAuthority;
    std::string mPath;
    // Includes its leading '#'.
    std::string mFragment;
    std::map<std::string, std::string> mQueries;

private:
    Uri();

    // The steps of parse, run by it in this order: the query step bounds itself
    // by the fragment position, so the fragment step must come first.
    // Where the path starts, or npos when there is no "//" authority.
    size_t parseAuthority();
    // Where the path ends, or npos when uri[start] is not '/'.
    size_t parsePath(size_t start);
    void parseFragment(size_t from);
    // 0 on success, 1 when a query item lacks '='.
    int parseQuery(size_t from);
};

}  // namespace TavoPlayer
