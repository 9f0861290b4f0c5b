#pragma once

#include "ConfigElement.h"

#include <istream>
#include <string>
#include <vector>

enum class SyntaxMode : int32_t {
    KeyValue = 1, // "key=value" lines: vsftpd.conf, per-user files, lists
    TokenLine = 2, // blank-separated words where "=" is ordinary: PAM files
};

// One configuration file held in memory as its list of line elements.
class ConfigFile
{
public:
    explicit ConfigFile(SyntaxMode mode = SyntaxMode::KeyValue);

    // Replaces the elements with the parse of the whole stream. Accepts any
    // bytes: every line becomes some element, nothing is ever an error.
    void parse(std::istream &in);
    void parseText(const std::string &text);

    std::ostream &write(std::ostream &out) const;
    std::string text() const;

    ConfigElementList elements;
    SyntaxMode mode;
    std::string commentChars = "#";
    bool flag = true;
};

// Queries and edits. Keys, names and tokens compare byte for byte and every
// operation acts on the first match in list order.

std::shared_ptr<ConfigElementSection> findSection(const ConfigElementList &list, const std::string &name);

// With an empty section name the list itself is searched.
std::shared_ptr<ConfigElementData> findData(const ConfigElementList &list, const std::string &section,
                                            const std::string &key);

bool containsToken(const ConfigElementList &list, const std::string &token);

// Puts a '#' comment line directly above the element.
void addComment(ConfigElementCommentable &element, const std::string &text);

// Adds "key=value" after the last line that is not empty, indented like the
// last data line of the list.
std::shared_ptr<ConfigElementData> appendData(ConfigElementList &list, const std::string &key, const std::string &value,
                                              const std::string &comment = {});

// Replaces the value of an existing key (its layout and comments stay) or
// appends the key. The option is reserved and has no effect.
void setValue(ConfigElementList &list, const std::string &section, const std::string &key, const std::string &value,
              const std::string &comment = {}, int option = 0);

// Token lines (PAM service files, name lists).

// True for "pam_userdb.so" and for any path whose last component it is.
bool tokenNamesModule(const std::string &token, const std::string &module);

// The first token line that holds the module, e.g. "pam_listfile.so".
std::shared_ptr<ConfigElementExpr> findModuleLine(const ConfigElementList &list, const std::string &module);

// Text after "name=" of the first such argument on the line; empty when none.
std::string tokenArgument(const ConfigElementExpr &line, const std::string &name);

// tokenArgument of the first line holding the module; empty when none.
std::string moduleArgument(const ConfigElementList &list, const std::string &module, const std::string &name);

// Replaces the value of the first "name=..." argument; false when absent.
bool setTokenArgument(ConfigElementExpr &line, const std::string &name, const std::string &value);

// Removes the token from every line holding it. A line left without tokens
// disappears; the comments above it stay in its place. Returns how many
// tokens were removed.
int removeTokenEverywhere(ConfigElementList &list, const std::string &token);

enum class InsertAt { Top, End };

// A new line of the tokens joined by single blanks. At the end it goes
// before the trailing empty lines, like appendData.
std::shared_ptr<ConfigElementExpr> insertTokenLine(ConfigElementList &list, const std::vector<std::string> &tokens,
                                                   InsertAt where);
