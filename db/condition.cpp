// EscapeCondition: the condition language of task listings and counts.
//
// Callers pass WHERE conditions as text ("task_id=7", "status=2 or status=6",
// "lower(username)=lower('alice')"). Such a text goes into a statement verbatim, so
// it is parsed here against a small grammar and written back token by token; nothing
// outside the grammar reaches the server.
//
//   condition  := or
//   or         := and { OR and }
//   and        := not { AND not }
//   not        := NOT not | predicate
//   predicate  := sum [ compare sum
//                     | [NOT] IN "(" sum { "," sum } ")"
//                     | [NOT] BETWEEN sum AND sum
//                     | [NOT] (LIKE | ILIKE) sum
//                     | IS [NOT] (NULL | TRUE | FALSE) ]
//   compare    := "=" | "<>" | "!=" | "<" | "<=" | ">" | ">="
//   sum        := product { ("+" | "-" | "&" | "|" | "#" | "<<" | ">>") product }
//   product    := unary { ("*" | "/" | "%") unary }
//   unary      := ("-" | "+" | "~") unary | primary
//   primary    := integer | 'string' | TRUE | FALSE | NULL | column
//               | (lower | upper | length) "(" sum ")" | "(" or ")"
//
// Keywords, columns and functions are case-insensitive; columns are those of
// download_queue, optionally written download_queue.column. Strings double their
// quotes ('it''s') and are escaped again on output. Anything else (";", comments,
// double quotes, dollar quoting, other names, subqueries) is refused.
#include "db/navodb.h"

#include <cctype>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

namespace {

enum class Kind { Word, Number, String, Symbol, End };

struct Token {
    Kind kind;
    std::string text; // words lower-cased; strings unescaped
};

constexpr const char *kColumns[] = {
    "task_id",
    "username",
    "pid",
    "url",
    "filename",
    "created_time",
    "started_time",
    "status",
    "total_size",
    "current_size",
    "current_rate",
    "total_peers",
    "connected_peers",
    "total_pieces",
    "downloaded_pieces",
    "available_pieces",
    "torrent",
    "upload_rate",
    "total_upload",
    "seeding_ratio",
    "seeding_interval",
    "seeding_elapsed",
    "seeders",
    "leechers",
    "task_flags",
    "destination",
    "extra_info",
};

constexpr const char *kFunctions[] = {"lower", "upper", "length"};

// Longest first, so that "<=" is not read as "<" then "=".
constexpr const char *kSymbols[] = {"<>", "!=", "<=", ">=", "<<", ">>", "=", "<", ">", "+", "-",
                                    "*",  "/",  "%",  "&",  "|",  "#",  "~", "(", ")", ","};

template <size_t N> bool one_of(const std::string &word, const char *const (&set)[N]) {
    for (const char *item : set)
        if (word == item)
            return true;
    return false;
}

bool tokenize(std::string_view in, std::vector<Token> &out) {
    size_t i = 0;
    while (i < in.size()) {
        unsigned char c = static_cast<unsigned char>(in[i]);
        if (std::isspace(c)) {
            ++i;
        } else if (std::isalpha(c) || c == '_') {
            size_t start = i;
            while (i < in.size() && (std::isalnum(static_cast<unsigned char>(in[i])) ||
                                     in[i] == '_' || in[i] == '.'))
                ++i;
            std::string word(in.substr(start, i - start));
            for (char &ch : word)
                ch = static_cast<char>(std::tolower(static_cast<unsigned char>(ch)));
            out.push_back({Kind::Word, word});
        } else if (std::isdigit(c)) {
            size_t start = i;
            while (i < in.size() && std::isdigit(static_cast<unsigned char>(in[i])))
                ++i;
            // "1e5" or "1abc" would be read by the server as something else entirely.
            if (i < in.size() &&
                (std::isalpha(static_cast<unsigned char>(in[i])) || in[i] == '_' || in[i] == '.'))
                return false;
            out.push_back({Kind::Number, std::string(in.substr(start, i - start))});
        } else if (c == '\'') {
            std::string value;
            for (++i;; ++i) {
                if (i >= in.size())
                    return false; // unbalanced quote
                if (in[i] == '\'') {
                    if (i + 1 < in.size() && in[i + 1] == '\'') {
                        value += '\'';
                        ++i;
                        continue;
                    }
                    ++i;
                    break;
                }
                value += in[i];
            }
            out.push_back({Kind::String, value});
        } else {
            const char *matched = nullptr;
            for (const char *sym : kSymbols)
                if (in.compare(i, std::strlen(sym), sym) == 0) {
                    matched = sym;
                    break;
                }
            if (matched == nullptr)
                return false;
            // "--" and "/*" open comments on the server.
            if ((in.compare(i, 2, "--") == 0) || (in.compare(i, 2, "/*") == 0))
                return false;
            out.push_back({Kind::Symbol, matched});
            i += std::strlen(matched);
        }
    }
    out.push_back({Kind::End, ""});
    return true;
}

class Parser {
  public:
    explicit Parser(const std::vector<Token> &tokens) : tokens_(tokens) {}

    bool parse(std::string &out) {
        if (!parse_or() || peek().kind != Kind::End)
            return false;
        out = std::move(out_);
        return true;
    }

  private:
    const Token &peek() const { return tokens_[pos_]; }
    bool is_word(const char *w) const { return peek().kind == Kind::Word && peek().text == w; }
    bool is_symbol(const char *s) const { return peek().kind == Kind::Symbol && peek().text == s; }

    void emit(const std::string &text) {
        if (!out_.empty())
            out_ += ' ';
        out_ += text;
    }
    void take() {
        const Token &t = tokens_[pos_++];
        if (t.kind != Kind::String) {
            emit(t.text);
            return;
        }
        std::string quoted = "'";
        for (char c : t.text) {
            if (c == '\'')
                quoted += '\'';
            quoted += c;
        }
        emit(quoted + "'");
    }
    bool take_word(const char *w) {
        if (!is_word(w))
            return false;
        take();
        return true;
    }
    bool take_symbol(const char *s) {
        if (!is_symbol(s))
            return false;
        take();
        return true;
    }

    // Nesting is bounded so that a hostile text cannot exhaust the stack.
    bool enter() { return ++depth_ <= 64; }

    bool parse_or() {
        if (!parse_and())
            return false;
        while (take_word("or"))
            if (!parse_and())
                return false;
        return true;
    }

    bool parse_and() {
        if (!parse_not())
            return false;
        while (take_word("and"))
            if (!parse_not())
                return false;
        return true;
    }

    bool parse_not() {
        if (take_word("not")) {
            if (!enter())
                return false;
            bool ok = parse_not();
            --depth_;
            return ok;
        }
        return parse_predicate();
    }

    bool parse_predicate() {
        if (!parse_sum())
            return false;
        static constexpr const char *kCompare[] = {"=", "<>", "!=", "<", "<=", ">", ">="};
        if (peek().kind == Kind::Symbol && one_of(peek().text, kCompare)) {
            take();
            return parse_sum();
        }
        if (take_word("is")) {
            take_word("not");
            return take_word("null") || take_word("true") || take_word("false");
        }
        bool negated = take_word("not"); // NOT IN, NOT BETWEEN, NOT LIKE
        if (take_word("in")) {
            if (!take_symbol("(") || !parse_sum())
                return false;
            while (take_symbol(","))
                if (!parse_sum())
                    return false;
            return take_symbol(")");
        }
        if (take_word("between"))
            return parse_sum() && take_word("and") && parse_sum();
        if (take_word("like") || take_word("ilike"))
            return parse_sum();
        // A bare NOT after an operand ("a NOT b") is not a predicate.
        return !negated;
    }

    bool parse_sum() {
        static constexpr const char *kOps[] = {"+", "-", "&", "|", "#", "<<", ">>"};
        if (!parse_product())
            return false;
        while (peek().kind == Kind::Symbol && one_of(peek().text, kOps)) {
            take();
            if (!parse_product())
                return false;
        }
        return true;
    }

    bool parse_product() {
        static constexpr const char *kOps[] = {"*", "/", "%"};
        if (!parse_unary())
            return false;
        while (peek().kind == Kind::Symbol && one_of(peek().text, kOps)) {
            take();
            if (!parse_unary())
                return false;
        }
        return true;
    }

    bool parse_unary() {
        if (is_symbol("-") || is_symbol("+") || is_symbol("~")) {
            take();
            if (!enter())
                return false;
            bool ok = parse_unary();
            --depth_;
            return ok;
        }
        return parse_primary();
    }

    bool parse_primary() {
        const Token &t = peek();
        if (t.kind == Kind::Number || t.kind == Kind::String) {
            take();
            return true;
        }
        if (t.kind == Kind::Symbol && t.text == "(") {
            take();
            if (!enter())
                return false;
            bool ok = parse_or() && take_symbol(")");
            --depth_;
            return ok;
        }
        if (t.kind != Kind::Word)
            return false;
        if (t.text == "true" || t.text == "false" || t.text == "null") {
            take();
            return true;
        }
        if (one_of(t.text, kFunctions)) {
            take();
            if (!take_symbol("(") || !enter())
                return false;
            bool ok = parse_sum() && take_symbol(")");
            --depth_;
            return ok;
        }
        std::string column = t.text;
        static constexpr std::string_view kTable = "download_queue.";
        if (column.compare(0, kTable.size(), kTable) == 0)
            column.erase(0, kTable.size());
        if (!one_of(column, kColumns))
            return false;
        take();
        return true;
    }

    const std::vector<Token> &tokens_;
    size_t pos_ = 0;
    int depth_ = 0;
    std::string out_;
};

} // namespace

int EscapeCondition(const char *condition, char *out, size_t out_size) noexcept {
    if (condition == nullptr || out == nullptr || out_size == 0)
        return -1;
    try {
        std::vector<Token> tokens;
        std::string safe;
        if (!tokenize(condition, tokens) || !Parser(tokens).parse(safe) || safe.size() >= out_size)
            return -1;
        std::memcpy(out, safe.c_str(), safe.size() + 1);
        return 0;
    } catch (...) {
        return -1;
    }
}
