#include "ConfigElement.h"

#include <algorithm>

std::ostream &writeIndent(std::ostream &out, int32_t columns)
{
    if (columns <= 0)
        return out;
    for (int32_t i = 0; i < columns / 4; ++i)
        out.put('\t');
    for (int32_t i = 0; i < columns % 4; ++i)
        out.put(' ');
    return out;
}

ConfigElementBase::ConfigElementBase(int32_t x, int32_t y)
    : x(x)
    , y(y)
{
}

ConfigElementBase::~ConfigElementBase() = default;

int32_t ConfigElementBase::xOffset() const
{
    return x;
}

int32_t ConfigElementBase::yOffset() const
{
    return y;
}

ConfigElementComment::ConfigElementComment(char commentChar, std::string text, int32_t x, int32_t y)
    : ConfigElementBase(x, y)
    , commentChar(commentChar)
    , text(std::move(text))
{
}

ElementType ConfigElementComment::type() const
{
    return ElementType::Comment;
}

std::ostream &ConfigElementComment::print(std::ostream &out)
{
    writeIndent(out, x);
    out.put(commentChar);
    out << text << std::endl;
    return out;
}

ElementType ConfigElementCommentBlock::type() const
{
    return ElementType::CommentBlock;
}

std::ostream &ConfigElementCommentBlock::print(std::ostream &out)
{
    for (const auto &comment : comments)
        comment->print(out);
    return out;
}

ElementType ConfigElementELine::type() const
{
    return ElementType::ELine;
}

std::ostream &ConfigElementELine::print(std::ostream &out)
{
    return out << std::endl;
}

std::ostream &ConfigElementCommentable::printComments(std::ostream &out)
{
    for (const auto &block : comments)
        block->print(out);
    return out;
}

ConfigElementSection::ConfigElementSection(std::string name, SectionStyle style, int32_t x, int32_t y)
    : ConfigElementCommentable(x, y)
    , name(std::move(name))
    , style(style)
{
}

ElementType ConfigElementSection::type() const
{
    return ElementType::Section;
}

std::ostream &ConfigElementSection::print(std::ostream &out)
{
    printComments(out);
    writeIndent(out, x);
    switch (style) {
    case SectionStyle::Bracket:
        out << '[' << name << ']' << std::endl;
        for (const auto &child : children)
            child->print(out);
        break;
    case SectionStyle::Brace:
        out << "service " << name << " { " << std::endl;
        for (const auto &child : children)
            child->print(out);
        writeIndent(out, closeIndent);
        out << '}' << std::endl;
        break;
    default:
        for (const auto &child : children)
            child->print(out);
        break;
    }
    return out;
}

ConfigElementData::ConfigElementData(std::string key, std::string value, int32_t x, int32_t y)
    : ConfigElementCommentable(x, y)
    , key(std::move(key))
    , value(std::move(value))
{
}

ElementType ConfigElementData::type() const
{
    return ElementType::Data;
}

std::ostream &ConfigElementData::print(std::ostream &out)
{
    printComments(out);
    writeIndent(out, x);
    out << key;
    writeIndent(out, gapBefore);
    out.put('=');
    writeIndent(out, gapAfter);
    out << value << std::endl;
    return out;
}

bool ConfigElementData::assignIfSameKey(const ConfigElementData &other)
{
    if (key != other.key)
        return false;
    value = other.value;
    return true;
}

ElementType ConfigElementExpr::type() const
{
    return ElementType::Expr;
}

std::ostream &ConfigElementExpr::print(std::ostream &out)
{
    printComments(out);
    writeIndent(out, x);
    for (auto it = tokens.begin(); it != tokens.end(); ++it) {
        out << it->text;
        if (std::next(it) != tokens.end())
            writeIndent(out, it->gap);
    }
    out << std::endl;
    return out;
}

bool ConfigElementExpr::hasToken(const std::string &token) const
{
    return std::any_of(tokens.begin(), tokens.end(), [&](const ConfigToken &t) { return t.text == token; });
}

void ConfigElementExpr::removeToken(const std::string &token)
{
    const auto it = std::find_if(tokens.begin(), tokens.end(), [&](const ConfigToken &t) { return t.text == token; });
    if (it != tokens.end())
        tokens.erase(it);
}

ConfigElementInclude::ConfigElementInclude(std::string keyword, std::string argument, int32_t x, int32_t y)
    : ConfigElementCommentable(x, y)
    , keyword(std::move(keyword))
    , argument(std::move(argument))
{
}

ElementType ConfigElementInclude::type() const
{
    return ElementType::Include;
}

std::ostream &ConfigElementInclude::print(std::ostream &out)
{
    printComments(out);
    writeIndent(out, x);
    out << keyword;
    writeIndent(out, gap);
    out << argument << std::endl;
    return out;
}
