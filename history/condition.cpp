#include <array>
#include <stdexcept>
#include <string_view>

#include "history/marudbquery_impl.h"

namespace marudbquery {
namespace {

using NodePointer = std::shared_ptr<const Condition::Node>;
using Kind = Condition::Node::Kind;

int Height(const NodePointer& node, Kind kind) {
  return node->kind == kind ? node->height : 0;
}

NodePointer NewJoin(Kind kind, NodePointer left, NodePointer right) {
  auto node = std::make_shared<Condition::Node>();
  node->kind = kind;
  node->height = 1 + std::max(Height(left, kind), Height(right, kind));
  node->left = std::move(left);
  node->right = std::move(right);
  return node;
}

/// Puts `item` where the tree is lowest, so that a chain of n joins is log n high. Order does not
/// matter to either join.
NodePointer Append(Kind kind, const NodePointer& tree, const NodePointer& item) {
  if (tree->kind != kind) return NewJoin(kind, tree, item);
  if (Height(tree->left, kind) < Height(tree->right, kind)) {
    return NewJoin(kind, Append(kind, tree->left, item), tree->right);
  }
  return NewJoin(kind, tree->left, Append(kind, tree->right, item));
}

NodePointer Join(Kind kind, const NodePointer& a, const NodePointer& b) {
  if (!a || !b) return a ? a : b;
  // The larger of two trees takes the other in.
  return Height(a, kind) >= Height(b, kind) ? Append(kind, a, b) : Append(kind, b, a);
}

/// The column that all of a tree of alternatives compare for equality, and their values in order;
/// null when it is not one column.
const std::string* OneColumn(const Condition::Node& node, std::vector<const Value*>& values) {
  if (node.kind == Kind::kCompare && node.op == "=") {
    values.push_back(&node.value);
    return &node.column;
  }
  if (node.kind != Kind::kOr) return nullptr;
  const std::string* left = OneColumn(*node.left, values);
  const std::string* right = left ? OneColumn(*node.right, values) : nullptr;
  return right && *left == *right ? left : nullptr;
}

bool IsOperator(std::string_view op) {
  constexpr std::array<std::string_view, 6> kOperators{"=", "!=", "<", "<=", ">", ">="};
  return std::find(kOperators.begin(), kOperators.end(), op) != kOperators.end();
}

}  // namespace

Condition Condition::Compare(const std::string& column, const std::string& op, Value value) {
  Condition condition;
  condition.root_ = std::make_shared<const Node>(
      Node{Node::kCompare, column, op, std::move(value), 0, nullptr, nullptr});
  return condition;
}

Condition Condition::HasSubstring(const std::string& column, const std::string& text) {
  Condition condition;
  condition.root_ =
      std::make_shared<const Node>(Node{Node::kSubstring, column, "", text, 0, nullptr, nullptr});
  return condition;
}

Condition Condition::Null() {
  return {};
}

Condition operator&&(const Condition& a, const Condition& b) {
  Condition condition;
  condition.root_ = Join(Condition::Node::kAnd, a.root_, b.root_);
  return condition;
}

Condition operator||(const Condition& a, const Condition& b) {
  Condition condition;
  condition.root_ = Join(Condition::Node::kOr, a.root_, b.root_);
  return condition;
}

StatementText::StatementText(Session& session, const std::string& table)
    : session_(session), table_(table) {
  if (!session_.HasTable(table)) throw std::runtime_error("no such table: " + table);
}

std::string StatementText::Column(const std::string& name) const {
  if (!session_.HasColumn(table_, name)) throw std::runtime_error("no such column: " + name);
  return Quoted(name);
}

std::string StatementText::Bind(const Value& value) {
  const auto* text = std::get_if<std::string>(&value);
  if (text && !session_.IsSQLite() && text->find('\0') != std::string::npos) {
    throw std::runtime_error("PostgreSQL keeps no NUL in a text");  // it would cut it short
  }
  values_.push_back(value);
  // SQLite looks names up one by one; thousands of values need nameless places.
  return session_.IsSQLite() ? "?" : ":v" + std::to_string(values_.size());
}

std::string StatementText::Where(const Condition& condition) {
  return condition.Root() ? " WHERE " + Of(*condition.Root()) : std::string();
}

std::string StatementText::Of(const Condition::Node& node) {
  switch (node.kind) {
    case Condition::Node::kCompare:
      if (!IsOperator(node.op)) throw std::runtime_error("no such operator: " + node.op);
      return Column(node.column) + " " + node.op + " " + Bind(node.value);
    case Condition::Node::kSubstring:
      // Unlike LIKE these know no special characters and no other case.
      return std::string(session_.IsSQLite() ? "instr(" : "strpos(") + Column(node.column) + ", " +
             Bind(node.value) + ") > 0";
    default: {
      if (node.kind == Condition::Node::kOr) {
        // A set of values is looked up; a chain of thousands of comparisons would be gone through
        // for every row.
        std::vector<const Value*> values;
        if (const std::string* column = OneColumn(node, values)) {
          std::string list;
          for (const Value* value : values) list += (list.empty() ? "" : ", ") + Bind(*value);
          return Column(*column) + " IN (" + list + ")";
        }
      }
      // One after the other: values are bound in the order of their places.
      const std::string left = Of(*node.left);
      const std::string right = Of(*node.right);
      return "(" + left + (node.kind == Condition::Node::kAnd ? " AND " : " OR ") + right + ")";
    }
  }
}

void StatementText::Prepare(soci::statement& statement, const std::string& text) {
  for (const Value& value : values_) {
    std::visit([&](const auto& bound) { statement.exchange(soci::use(bound)); }, value);
  }
  statement.alloc();
  statement.prepare(text);
  statement.define_and_bind();
}

}  // namespace marudbquery
