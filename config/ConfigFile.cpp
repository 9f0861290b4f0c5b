#include "ConfigFile.h"

#include <iterator>
#include <sstream>
#include <string_view>

namespace {

bool isBlank(char c)
{
    return c == ' ' || c == '\t';
}

int32_t blankColumns(char c)
{
    return c == '\t' ? 4 : 1;
}

// Counts the blank columns from pos on and moves pos past them.
int32_t skipBlanks(std::string_view line, size_t &pos)
{
    int32_t columns = 0;
    while (pos < line.size() && isBlank(line[pos]))
        columns += blankColumns(line[pos++]);
    return columns;
}

std::string_view trimRight(std::string_view text)
{
    size_t end = text.size();
    while (end > 0 && isBlank(text[end - 1]))
        --end;
    return text.substr(0, end);
}

std::vector<std::string_view> words(std::string_view text)
{
    std::vector<std::string_view> result;
    size_t pos = 0;
    while (pos < text.size()) {
        skipBlanks(text, pos);
        const size_t start = pos;
        while (pos < text.size() && !isBlank(text[pos]))
            ++pos;
        if (pos > start)
            result.push_back(text.substr(start, pos - start));
    }
    return result;
}

// "service NAME {" alone on its line opens a brace block. Any other line with
// a brace stays an ordinary line, so no header text can be lost in printing.
bool isBraceOpener(std::string_view text)
{
    const auto w = words(text);
    return w.size() == 3 && w[0] == "service" && w[2] == "{";
}

bool isLoneCloser(std::string_view text)
{
    const auto w = words(text);
    return w.size() == 1 && w[0] == "}";
}

class Parser
{
public:
    Parser(const ConfigFile &file, std::string_view data)
        : m_file(file)
    {
        size_t start = 0;
        while (start < data.size()) {
            const size_t end = data.find('\n', start);
            if (end == std::string_view::npos) {
                m_lines.push_back(data.substr(start));
                break;
            }
            m_lines.push_back(data.substr(start, end - start));
            start = end + 1;
        }
        // A trailing run of blanks with no line end after it is no line.
        if (!m_lines.empty() && data.back() != '\n' && trimRight(m_lines.back()).empty())
            m_lines.pop_back();
    }

    ConfigElementList run()
    {
        // A block is opened only when a closing line follows somewhere, so
        // an unterminated "service x {" never gains a "}" on printing.
        size_t lastCloser = 0;
        bool haveCloser = false;
        for (size_t i = 0; i < m_lines.size(); ++i) {
            if (isLoneCloser(m_lines[i])) {
                lastCloser = i;
                haveCloser = true;
            }
        }

        ConfigElementList elements;
        std::shared_ptr<ConfigElementSection> open;
        for (size_t i = 0; i < m_lines.size(); ++i) {
            ConfigElementList &current = open ? open->children : elements;
            const std::string_view line = m_lines[i];
            const auto y = static_cast<int32_t>(i);
            size_t pos = 0;
            const int32_t indent = skipBlanks(line, pos);
            if (pos == line.size()) {
                current.push_back(std::make_shared<ConfigElementELine>(0, y));
                continue;
            }
            const char first = line[pos];
            if (m_file.commentChars.find(first) != std::string::npos) {
                // Counted in columns like every other line, so that a comment
                // indented with tabs prints back with the same tabs.
                current.push_back(
                    std::make_shared<ConfigElementComment>(first, std::string(line.substr(pos + 1)), indent, y));
            } else if (first == '@') {
                current.push_back(parseInclude(line, pos, indent, y));
            } else if (m_file.mode == SyntaxMode::KeyValue && line.find('=', pos) != std::string_view::npos) {
                current.push_back(parseData(line, pos, indent, y));
            } else if (!open && haveCloser && i < lastCloser && isBraceOpener(line)) {
                open = std::make_shared<ConfigElementSection>(std::string(words(line)[1]), SectionStyle::Brace, indent,
                                                              y);
                elements.push_back(open);
            } else if (open && isLoneCloser(line)) {
                open->closeIndent = indent;
                open.reset();
            } else if (first == '[' && trimRight(line).size() > pos + 1 && trimRight(line).back() == ']') {
                const std::string_view trimmed = trimRight(line);
                current.push_back(std::make_shared<ConfigElementSection>(
                    std::string(trimmed.substr(pos + 1, trimmed.size() - pos - 2)), SectionStyle::Bracket, indent, y));
            } else {
                current.push_back(parseExpr(line, pos, indent, y));
            }
        }
        groupComments(elements);
        return elements;
    }

private:
    static ConfigElementPtr parseInclude(std::string_view line, size_t pos, int32_t indent, int32_t y)
    {
        const size_t start = pos;
        while (pos < line.size() && !isBlank(line[pos]))
            ++pos;
        auto include = std::make_shared<ConfigElementInclude>(std::string(line.substr(start, pos - start)),
                                                              std::string(), indent, y);
        include->gap = skipBlanks(line, pos);
        include->argument = std::string(line.substr(pos));
        return include;
    }

    static ConfigElementPtr parseData(std::string_view line, size_t pos, int32_t indent, int32_t y)
    {
        const size_t equals = line.find('=', pos);
        const std::string_view rawKey = line.substr(pos, equals - pos);
        const std::string_view key = trimRight(rawKey);
        auto data = std::make_shared<ConfigElementData>(std::string(key), std::string(), indent, y);
        size_t gapPos = pos + key.size();
        data->gapBefore = skipBlanks(line, gapPos);
        size_t valuePos = equals + 1;
        data->gapAfter = skipBlanks(line, valuePos);
        data->value = std::string(line.substr(valuePos));
        return data;
    }

    static ConfigElementPtr parseExpr(std::string_view line, size_t pos, int32_t indent, int32_t y)
    {
        auto expr = std::make_shared<ConfigElementExpr>(indent, y);
        bool quoted = false;
        std::string text;
        while (pos < line.size()) {
            const char c = line[pos];
            if (!quoted && isBlank(c)) {
                const int32_t gap = skipBlanks(line, pos);
                expr->tokens.push_back({std::move(text), gap});
                text.clear();
                continue;
            }
            if (c == '\'' || c == '"')
                quoted = !quoted;
            text.push_back(c);
            ++pos;
        }
        if (!text.empty())
            expr->tokens.push_back({std::move(text), 0});
        return expr;
    }

    static bool isCommentable(const ConfigElementPtr &element)
    {
        switch (element->type()) {
        case ElementType::Section:
        case ElementType::Data:
        case ElementType::Expr:
        case ElementType::Include:
            return true;
        default:
            return false;
        }
    }

    // Runs of comments on consecutive lines become one block; a block that
    // stands directly above a line belongs to that line.
    static void groupComments(ConfigElementList &list)
    {
        ConfigElementList grouped;
        for (auto it = list.begin(); it != list.end();) {
            if ((*it)->type() == ElementType::Section)
                groupComments(std::static_pointer_cast<ConfigElementSection>(*it)->children);
            if ((*it)->type() != ElementType::Comment) {
                grouped.push_back(*it++);
                continue;
            }
            auto block = std::make_shared<ConfigElementCommentBlock>((*it)->x, (*it)->y);
            int32_t lastLine = (*it)->y;
            block->comments.push_back(*it++);
            while (it != list.end() && (*it)->type() == ElementType::Comment && (*it)->y == lastLine + 1) {
                lastLine = (*it)->y;
                block->comments.push_back(*it++);
            }
            if (it != list.end() && isCommentable(*it) && (*it)->y == lastLine + 1)
                std::static_pointer_cast<ConfigElementCommentable>(*it)->comments.push_back(block);
            else
                grouped.push_back(block);
        }
        list.swap(grouped);
    }

    const ConfigFile &m_file;
    std::vector<std::string_view> m_lines;
};

ConfigElementList::iterator afterLastNonEmpty(ConfigElementList &list)
{
    auto it = list.end();
    while (it != list.begin()) {
        auto previous = std::prev(it);
        if ((*previous)->type() != ElementType::ELine)
            return it;
        it = previous;
    }
    return list.begin();
}

} // namespace

ConfigFile::ConfigFile(SyntaxMode mode)
    : mode(mode)
{
}

void ConfigFile::parse(std::istream &in)
{
    const std::string data((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    parseText(data);
}

void ConfigFile::parseText(const std::string &text)
{
    elements = Parser(*this, text).run();
}

std::ostream &ConfigFile::write(std::ostream &out) const
{
    for (const auto &element : elements)
        element->print(out);
    return out;
}

std::string ConfigFile::text() const
{
    std::ostringstream out;
    write(out);
    return out.str();
}

std::shared_ptr<ConfigElementSection> findSection(const ConfigElementList &list, const std::string &name)
{
    for (const auto &element : list) {
        if (element->type() != ElementType::Section)
            continue;
        auto section = std::dynamic_pointer_cast<ConfigElementSection>(element);
        if (section && section->name == name)
            return section;
    }
    return {};
}

std::shared_ptr<ConfigElementData> findData(const ConfigElementList &list, const std::string &section,
                                            const std::string &key)
{
    const ConfigElementList *searched = &list;
    if (!section.empty()) {
        const auto found = findSection(list, section);
        if (!found)
            return {};
        searched = &found->children;
    }
    for (const auto &element : *searched) {
        if (element->type() != ElementType::Data)
            continue;
        auto data = std::dynamic_pointer_cast<ConfigElementData>(element);
        if (data && data->key == key)
            return data;
    }
    return {};
}

bool containsToken(const ConfigElementList &list, const std::string &token)
{
    for (const auto &element : list) {
        if (element->type() != ElementType::Expr)
            continue;
        const auto expr = std::dynamic_pointer_cast<ConfigElementExpr>(element);
        if (expr && expr->hasToken(token))
            return true;
    }
    return false;
}

void addComment(ConfigElementCommentable &element, const std::string &text)
{
    auto comment = std::make_shared<ConfigElementComment>('#', text);
    if (!element.comments.empty()) {
        if (auto block = std::dynamic_pointer_cast<ConfigElementCommentBlock>(element.comments.front())) {
            block->comments.push_back(comment);
            return;
        }
    }
    auto block = std::make_shared<ConfigElementCommentBlock>();
    block->comments.push_back(comment);
    element.comments.push_back(block);
}

std::shared_ptr<ConfigElementData> appendData(ConfigElementList &list, const std::string &key, const std::string &value,
                                              const std::string &comment)
{
    int32_t x = 0;
    for (auto it = list.rbegin(); it != list.rend(); ++it) {
        if ((*it)->type() == ElementType::Data) {
            x = (*it)->xOffset();
            break;
        }
    }
    auto data = std::make_shared<ConfigElementData>(key, value, x, 0);
    if (!comment.empty())
        addComment(*data, comment);
    list.insert(afterLastNonEmpty(list), data);
    return data;
}

void setValue(ConfigElementList &list, const std::string &section, const std::string &key, const std::string &value,
              const std::string &comment, int /*option*/)
{
    if (const auto data = findData(list, section, key)) {
        data->value = value;
        return;
    }
    if (section.empty()) {
        appendData(list, key, value, comment);
        return;
    }
    auto target = findSection(list, section);
    if (!target) {
        target = std::make_shared<ConfigElementSection>(section, SectionStyle::Bracket);
        list.insert(afterLastNonEmpty(list), target);
    }
    auto data = std::make_shared<ConfigElementData>(key, value);
    if (!comment.empty())
        addComment(*data, comment);
    target->children.push_back(data);
}

bool tokenNamesModule(const std::string &token, const std::string &module)
{
    if (token == module)
        return true;
    return token.size() > module.size() && token.compare(token.size() - module.size(), module.size(), module) == 0
        && token[token.size() - module.size() - 1] == '/';
}

std::shared_ptr<ConfigElementExpr> findModuleLine(const ConfigElementList &list, const std::string &module)
{
    for (const auto &element : list) {
        if (element->type() != ElementType::Expr)
            continue;
        auto expr = std::dynamic_pointer_cast<ConfigElementExpr>(element);
        if (!expr)
            continue;
        for (const auto &token : expr->tokens) {
            if (tokenNamesModule(token.text, module))
                return expr;
        }
    }
    return {};
}

std::string tokenArgument(const ConfigElementExpr &line, const std::string &name)
{
    const std::string prefix = name + '=';
    for (const auto &token : line.tokens) {
        if (token.text.compare(0, prefix.size(), prefix) == 0)
            return token.text.substr(prefix.size());
    }
    return {};
}

std::string moduleArgument(const ConfigElementList &list, const std::string &module, const std::string &name)
{
    const auto line = findModuleLine(list, module);
    return line ? tokenArgument(*line, name) : std::string();
}

bool setTokenArgument(ConfigElementExpr &line, const std::string &name, const std::string &value)
{
    const std::string prefix = name + '=';
    for (auto &token : line.tokens) {
        if (token.text.compare(0, prefix.size(), prefix) == 0) {
            token.text = prefix + value;
            return true;
        }
    }
    return false;
}

int removeTokenEverywhere(ConfigElementList &list, const std::string &token)
{
    int removed = 0;
    for (auto it = list.begin(); it != list.end();) {
        auto expr = (*it)->type() == ElementType::Expr ? std::dynamic_pointer_cast<ConfigElementExpr>(*it) : nullptr;
        if (!expr) {
            ++it;
            continue;
        }
        while (expr->hasToken(token)) {
            expr->removeToken(token);
            ++removed;
        }
        if (!expr->tokens.empty()) {
            ++it;
            continue;
        }
        list.insert(it, expr->comments.begin(), expr->comments.end());
        it = list.erase(it);
    }
    return removed;
}

std::shared_ptr<ConfigElementExpr> insertTokenLine(ConfigElementList &list, const std::vector<std::string> &tokens,
                                                   InsertAt where)
{
    auto line = std::make_shared<ConfigElementExpr>();
    for (const auto &text : tokens)
        line->tokens.push_back({text, 1});
    if (!line->tokens.empty())
        line->tokens.back().gap = 0;
    list.insert(where == InsertAt::Top ? list.begin() : afterLastNonEmpty(list), line);
    return line;
}
