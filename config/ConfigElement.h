#pragma once

#include <cstdint>
#include <list>
#include <memory>
#include <ostream>
#include <string>

// The line elements a configuration file is held as. Every file the program
// edits becomes a flat, ordered list of these; untouched elements print back
// the line they came from, so an edit touches only the lines it means to.

enum class ElementType : int32_t {
    Comment = 0,
    CommentBlock = 1,
    Section = 2,
    Data = 3,
    ELine = 4,
    Expr = 5,
    Include = 6,
};

class ConfigElementBase;
using ConfigElementPtr = std::shared_ptr<ConfigElementBase>;
using ConfigElementList = std::list<ConfigElementPtr>;

// Writes a column count as tabs of four columns followed by the remaining
// spaces: "\t\t " for 9. Input tabs count four columns, so tab indentation
// survives a round trip and space indentation is normalised.
std::ostream &writeIndent(std::ostream &out, int32_t columns);

class ConfigElementBase
{
public:
    ConfigElementBase(int32_t x = 0, int32_t y = 0);
    virtual ~ConfigElementBase();

    virtual ElementType type() const = 0;
    virtual std::ostream &print(std::ostream &out) = 0;

    int32_t xOffset() const;
    int32_t yOffset() const;

    // Column of the line's first character (a tab counts four) and the
    // 0-based line number.
    int32_t x;
    int32_t y;
};

class ConfigElementComment : public ConfigElementBase
{
public:
    ConfigElementComment(char commentChar, std::string text, int32_t x = 0, int32_t y = 0);
    ElementType type() const override;
    std::ostream &print(std::ostream &out) override;

    char commentChar;
    std::string text;
};

class ConfigElementCommentBlock : public ConfigElementBase
{
public:
    using ConfigElementBase::ConfigElementBase;
    ElementType type() const override;
    std::ostream &print(std::ostream &out) override;

    ConfigElementList comments;
};

class ConfigElementELine : public ConfigElementBase
{
public:
    using ConfigElementBase::ConfigElementBase;
    ElementType type() const override;
    std::ostream &print(std::ostream &out) override;
};

// An element that carries the comment lines standing directly above it, so
// that they move and disappear together with the line they describe.
class ConfigElementCommentable : public ConfigElementBase
{
public:
    using ConfigElementBase::ConfigElementBase;

protected:
    std::ostream &printComments(std::ostream &out);

public:
    ConfigElementList comments;
};

enum class SectionStyle : int32_t {
    Bracket = 0, // "[name]"
    Brace = 1, // "service name {" ... "}"
};

class ConfigElementSection : public ConfigElementCommentable
{
public:
    ConfigElementSection(std::string name, SectionStyle style, int32_t x = 0, int32_t y = 0);
    ElementType type() const override;
    std::ostream &print(std::ostream &out) override;

    std::string name;
    SectionStyle style;
    ConfigElementList children;
    int32_t closeIndent = 0;
};

class ConfigElementData : public ConfigElementCommentable
{
public:
    ConfigElementData(std::string key, std::string value, int32_t x = 0, int32_t y = 0);
    ElementType type() const override;
    std::ostream &print(std::ostream &out) override;

    // Copies the other element's value when both have the same key.
    bool assignIfSameKey(const ConfigElementData &other);

    std::string key;
    std::string value;
    int32_t gapBefore = 0;
    int32_t gapAfter = 0;
};

struct ConfigToken
{
    std::string text;
    int32_t gap = 1; // blank columns that followed the token on its line
};

class ConfigElementExpr : public ConfigElementCommentable
{
public:
    using ConfigElementCommentable::ConfigElementCommentable;
    ElementType type() const override;
    std::ostream &print(std::ostream &out) override;

    bool hasToken(const std::string &token) const;
    void removeToken(const std::string &token);

    std::list<ConfigToken> tokens;
};

class ConfigElementInclude : public ConfigElementCommentable
{
public:
    ConfigElementInclude(std::string keyword, std::string argument, int32_t x = 0, int32_t y = 0);
    ElementType type() const override;
    std::ostream &print(std::ostream &out) override;

    std::string keyword;
    std::string argument;
    int32_t gap = 1;
};
