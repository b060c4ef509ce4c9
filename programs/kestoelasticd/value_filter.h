#pragma once

#include <xapian.h>

#include <functional>
#include <string>

namespace elasticd {

/// A part of a query that matches the documents whose value in a slot passes a test, each with the
/// same weight. Meant to stand beside parts that narrow the choice: it looks at every value left.
class ValueFilter : public Xapian::PostingSource {
  public:
    using Test = std::function<bool(const std::string& value)>;

    ValueFilter(Xapian::valueno slot, Test test, double weight);

    Xapian::doccount get_termfreq_min() const override { return 0; }
    Xapian::doccount get_termfreq_est() const override { return frequency_ / 4; }
    Xapian::doccount get_termfreq_max() const override { return frequency_; }
    double get_weight() const override { return weight_; }
    void next(double min_weight) override;
    void skip_to(Xapian::docid document, double min_weight) override;
    bool check(Xapian::docid document, double min_weight) override;
    bool at_end() const override { return started_ && value_ == end_; }
    Xapian::docid get_docid() const override { return value_.get_docid(); }
    void init(const Xapian::Database& database) override;
    std::string get_description() const override { return "ValueFilter"; }

  private:
    void FindMatch();

    const Xapian::valueno slot_;
    const Test test_;
    const double weight_;
    Xapian::Database database_;
    Xapian::ValueIterator value_;
    Xapian::ValueIterator end_;
    Xapian::doccount frequency_ = 0;
    bool started_ = false;
};

}  // namespace elasticd
