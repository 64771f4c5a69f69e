#pragma once

#include <boost/make_shared.hpp>
#include <boost/shared_ptr.hpp>

#include "analysis/src/job_input.h"
#include "platform/tessel/guid.h"
#include "tracking/track_store.h"

namespace kelp::analysis {

// What an analysis gave, and the identities of what it was made from. Instances, renders and saves
// share a record of it, which therefore never changes; see Replace.
struct AnalysisResult {
  JobInput job_input;
  tessel::utility::Guid source_identity;   // GetUpstreamIdentifier; nil if not known
  tessel::utility::Guid tracker_identity;  // GetIdentifierForTracker
  // first_frame: absolute index of row 0; fields count as frames.
  marrow::tracking::AllFeatures all_features;
};

// Puts a changed copy in the place of a record that others may hold: change(record). Nothing is
// replaced where that throws.
template <class Record, class Change>
void Replace(boost::shared_ptr<const Record>& record, const Change& change) {
  const auto next = boost::make_shared<Record>(*record);
  change(*next);
  record = next;
}

}  // namespace kelp::analysis
