#include "programs/kestoelasticd/value_filter.h"

#include <utility>

namespace elasticd {

ValueFilter::ValueFilter(Xapian::valueno slot, Test test, double weight)
    : slot_(slot), test_(std::move(test)), weight_(weight) {}

void ValueFilter::init(const Xapian::Database& database) {
    database_ = database;
    started_ = false;
    frequency_ = database.get_value_freq(slot_);
    set_maxweight(weight_);
}

void ValueFilter::next(double /*min_weight*/) {
    if (started_) {
        ++value_;
    } else {
        started_ = true;
        value_ = database_.valuestream_begin(slot_);
    }
    FindMatch();
}

void ValueFilter::skip_to(Xapian::docid document, double /*min_weight*/) {
    if (!started_) {
        started_ = true;
        value_ = database_.valuestream_begin(slot_);
    }
    if (value_ != end_) {
        value_.skip_to(document);
        FindMatch();
    }
}

/// Looks at this document alone, where skip_to would search on for a match that nobody needs.
bool ValueFilter::check(Xapian::docid document, double /*min_weight*/) {
    if (!started_) {
        started_ = true;
        value_ = database_.valuestream_begin(slot_);
    }
    if (value_ == end_) {
        return true;
    }
    if (!value_.check(document)) {
        return false;
    }
    return value_ == end_ || (value_.get_docid() == document && test_(*value_));
}

void ValueFilter::FindMatch() {
    while (value_ != end_ && !test_(*value_)) {
        ++value_;
    }
}

}  // namespace elasticd
