// A record as one page that stands alone: to be read in a browser, printed, or attached to a ticket.
//
// It has no script and asks for nothing, and what comes from outside stays text, whatever it is made of.
#pragma once

#include <string>

#include "transaction/record.h"

/// The whole document.
std::string pageOf(const Record &record);

/// Writes record.html in the transaction's folder, mode 0600: a new file, on disk, then renamed. Where that
/// fails the record's messages say so: the page is a view of the record, which must be written all the same.
void writePage(const std::string &folder, Record &record);
