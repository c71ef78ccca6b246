#include "model/ProtoText.h"

#include "model/Utf8.h"

#include <cctype>
#include <cstdint>
#include <utility>

#include <opencv2/core.hpp>

namespace vora {
namespace prototext {

const Field* Message::First(const std::string& name) const {
    for (const Field& field : fields)
        if (field.name == name) return &field;
    return nullptr;
}

std::vector<const Field*> Message::All(const std::string& name) const {
    std::vector<const Field*> found;
    for (const Field& field : fields)
        if (field.name == name) found.push_back(&field);
    return found;
}

std::string Message::Scalar(const std::string& name, const std::string& fallback) const {
    for (const Field& field : fields)
        if (field.name == name && !field.isMessage) return field.value;
    return fallback;
}

std::vector<std::string> Message::Scalars(const std::string& name) const {
    std::vector<std::string> values;
    for (const Field& field : fields)
        if (field.name == name && !field.isMessage) values.push_back(field.value);
    return values;
}

Field Field::MakeScalar(std::string name, std::string value, bool quoted) {
    Field field;
    field.name = std::move(name);
    field.value = std::move(value);
    field.quoted = quoted;
    return field;
}

Field Field::MakeMessage(std::string name, Message message) {
    Field field;
    field.name = std::move(name);
    field.isMessage = true;
    field.message = std::move(message);
    return field;
}

namespace {

enum class TokenKind { End, Word, String, Symbol };

struct Token {
    TokenKind kind = TokenKind::End;
    std::string text;  // Word: as written; String: decoded; Symbol: the character
    int line = 1;
    int column = 1;
};

bool IsWordChar(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) || c == '_' || c == '.' || c == '+' || c == '-';
}

bool IsIdentifier(const std::string& word) {
    if (word.empty() || std::isdigit(static_cast<unsigned char>(word[0]))) return false;
    for (char c : word)
        if (!std::isalnum(static_cast<unsigned char>(c)) && c != '_') return false;
    return true;
}

int HexValue(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}


class Tokenizer {
public:
    explicit Tokenizer(const std::string& text) : m_text(text) { Advance(); }

    const Token& Peek() const { return m_current; }

    Token Take() {
        Token taken = m_current;
        Advance();
        return taken;
    }

    [[noreturn]] void Fail(const Token& at, const std::string& what) const {
        CV_Error(cv::Error::StsParseError, "network definition, line " + std::to_string(at.line) +
                                               ", column " + std::to_string(at.column) + ": " + what);
    }

private:
    bool AtEnd() const { return m_pos >= m_text.size(); }
    char Current() const { return m_text[m_pos]; }

    void Step() {
        if (m_text[m_pos] == '\n') {
            ++m_line;
            m_column = 1;
        } else {
            ++m_column;
        }
        ++m_pos;
    }

    void SkipSpaceAndComments() {
        while (!AtEnd()) {
            const char c = Current();
            if (c == '#') {
                while (!AtEnd() && Current() != '\n') Step();
            } else if (std::isspace(static_cast<unsigned char>(c))) {
                Step();
            } else {
                return;
            }
        }
    }

    void Advance() {
        SkipSpaceAndComments();
        m_current = Token();
        m_current.line = m_line;
        m_current.column = m_column;
        if (AtEnd()) return;
        const char c = Current();
        if (c == '"' || c == '\'') {
            // Adjacent literals join into one string, as in C.
            m_current.kind = TokenKind::String;
            while (!AtEnd() && (Current() == '"' || Current() == '\'')) {
                ReadString(m_current.text);
                SkipSpaceAndComments();
            }
        } else if (IsWordChar(c)) {
            m_current.kind = TokenKind::Word;
            while (!AtEnd() && IsWordChar(Current())) {
                m_current.text.push_back(Current());
                Step();
            }
        } else {
            m_current.kind = TokenKind::Symbol;
            m_current.text.assign(1, c);
            Step();
        }
    }

    [[noreturn]] void FailHere(const std::string& what) const {
        Token here;
        here.line = m_line;
        here.column = m_column;
        Fail(here, what);
    }

    void ReadString(std::string& out) {
        const char quote = Current();
        Step();
        for (;;) {
            if (AtEnd() || Current() == '\n') FailHere("unterminated string");
            const char c = Current();
            Step();
            if (c == quote) return;
            if (c != '\\') {
                out.push_back(c);
                continue;
            }
            if (AtEnd()) FailHere("unterminated string");
            const char e = Current();
            Step();
            switch (e) {
                case 'n': out.push_back('\n'); break;
                case 't': out.push_back('\t'); break;
                case 'r': out.push_back('\r'); break;
                case 'a': out.push_back('\a'); break;
                case 'b': out.push_back('\b'); break;
                case 'f': out.push_back('\f'); break;
                case 'v': out.push_back('\v'); break;
                case '\\': case '\'': case '"': case '?': out.push_back(e); break;
                case 'x': case 'X': {
                    int value = 0;
                    int digits = 0;
                    while (digits < 2 && !AtEnd() && HexValue(Current()) >= 0) {
                        value = value * 16 + HexValue(Current());
                        Step();
                        ++digits;
                    }
                    if (digits == 0) FailHere("\\x without hex digits");
                    out.push_back(static_cast<char>(value));
                    break;
                }
                case 'u': case 'U': {
                    const int want = e == 'u' ? 4 : 8;
                    uint32_t code = 0;
                    for (int i = 0; i < want; ++i) {
                        if (AtEnd() || HexValue(Current()) < 0) FailHere("bad unicode escape");
                        code = code * 16 + static_cast<uint32_t>(HexValue(Current()));
                        Step();
                    }
                    if (code > 0x10FFFF) FailHere("unicode escape out of range");
                    AppendUtf8(out, code);
                    break;
                }
                default:
                    if (e >= '0' && e <= '7') {
                        int value = e - '0';
                        for (int i = 0; i < 2 && !AtEnd() && Current() >= '0' && Current() <= '7'; ++i) {
                            value = value * 8 + (Current() - '0');
                            Step();
                        }
                        out.push_back(static_cast<char>(value & 0xFF));
                    } else {
                        FailHere(std::string("unknown escape \\") + e);
                    }
            }
        }
    }

    const std::string& m_text;
    size_t m_pos = 0;
    int m_line = 1;
    int m_column = 1;
    Token m_current;
};

bool IsSymbol(const Token& token, char symbol) {
    return token.kind == TokenKind::Symbol && token.text[0] == symbol;
}

class Parser {
public:
    explicit Parser(const std::string& text) : m_tokens(text) {}

    Message ParseTopLevel() {
        Message message = ParseFields('\0');
        return message;
    }

private:
    // Fields up to the closing symbol (or the end of the text for '\0').
    Message ParseFields(char close) {
        Message message;
        for (;;) {
            const Token& next = m_tokens.Peek();
            if (next.kind == TokenKind::End) {
                if (close != '\0') m_tokens.Fail(next, std::string("missing '") + close + "'");
                return message;
            }
            if (close != '\0' && IsSymbol(next, close)) {
                m_tokens.Take();
                return message;
            }
            ParseField(message);
        }
    }

    void ParseField(Message& into) {
        const Token name = m_tokens.Take();
        if (name.kind != TokenKind::Word || !IsIdentifier(name.text))
            m_tokens.Fail(name, "expected a field name, found '" + name.text + "'");
        bool colon = false;
        if (IsSymbol(m_tokens.Peek(), ':')) {
            m_tokens.Take();
            colon = true;
        }
        const Token& next = m_tokens.Peek();
        if (IsSymbol(next, '{') || IsSymbol(next, '<')) {
            into.fields.push_back(Field::MakeMessage(name.text, ParseBlock()));
        } else if (colon && IsSymbol(next, '[')) {
            m_tokens.Take();
            if (IsSymbol(m_tokens.Peek(), ']')) {
                m_tokens.Take();
            } else {
                for (;;) {
                    ParseListItem(name.text, into);
                    const Token separator = m_tokens.Take();
                    if (IsSymbol(separator, ']')) break;
                    if (!IsSymbol(separator, ',')) m_tokens.Fail(separator, "expected ',' or ']' in a list");
                }
            }
        } else if (colon) {
            into.fields.push_back(ParseScalar(name.text));
        } else {
            m_tokens.Fail(next, "expected ':' or '{' after '" + name.text + "'");
        }
        if (IsSymbol(m_tokens.Peek(), ',') || IsSymbol(m_tokens.Peek(), ';')) m_tokens.Take();
    }

    void ParseListItem(const std::string& name, Message& into) {
        const Token& next = m_tokens.Peek();
        if (IsSymbol(next, '{') || IsSymbol(next, '<'))
            into.fields.push_back(Field::MakeMessage(name, ParseBlock()));
        else
            into.fields.push_back(ParseScalar(name));
    }

    // The reader recurses once per level: the limit keeps a hostile file
    // from exhausting the stack.
    Message ParseBlock() {
        const Token open = m_tokens.Take();
        if (m_depth == kMaxNesting)
            m_tokens.Fail(open, "blocks nested deeper than " + std::to_string(kMaxNesting) + " levels");
        ++m_depth;
        Message message = ParseFields(IsSymbol(open, '{') ? '}' : '>');
        --m_depth;
        return message;
    }

    Field ParseScalar(const std::string& name) {
        const Token value = m_tokens.Take();
        if (value.kind == TokenKind::String) return Field::MakeScalar(name, value.text, true);
        if (value.kind == TokenKind::Word) return Field::MakeScalar(name, value.text, false);
        m_tokens.Fail(value, "expected a value for '" + name + "'");
    }

    Tokenizer m_tokens;
    int m_depth = 0;
};

void WriteQuoted(std::string& out, const std::string& value) {
    static const char* const kHex = "0123456789abcdef";
    out.push_back('"');
    for (char c : value) {
        const unsigned char u = static_cast<unsigned char>(c);
        switch (c) {
            case '"': out += "\\\""; break;
            case '\\': out += "\\\\"; break;
            case '\n': out += "\\n"; break;
            case '\r': out += "\\r"; break;
            case '\t': out += "\\t"; break;
            default:
                if (u < 0x20 || u == 0x7F) {
                    out += "\\x";
                    out.push_back(kHex[u >> 4]);
                    out.push_back(kHex[u & 0xF]);
                } else {
                    out.push_back(c);  // bytes >= 0x80 pass through (UTF-8)
                }
        }
    }
    out.push_back('"');
}

void WriteMessage(std::string& out, const Message& message, int depth) {
    const std::string indent(static_cast<size_t>(depth) * 2, ' ');
    for (const Field& field : message.fields) {
        out += indent;
        out += field.name;
        if (field.isMessage) {
            out += " {\n";
            WriteMessage(out, field.message, depth + 1);
            out += indent;
            out += "}\n";
        } else {
            out += ": ";
            if (field.quoted)
                WriteQuoted(out, field.value);
            else
                out += field.value;
            out += "\n";
        }
    }
}

}  // namespace

Message Parse(const std::string& text) {
    Parser parser(text);
    return parser.ParseTopLevel();
}

std::string Write(const Message& message) {
    std::string out;
    WriteMessage(out, message, 0);
    return out;
}

}  // namespace prototext
}  // namespace vora
