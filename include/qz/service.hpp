/*
 * The tasks of every service with an ACL, for C++17 and later, above <qz/acl.hpp>: rereading it when its file
 * changes, deciding in an agreed order with an explanation, and handlers for hosts.
 *
 *   qz::live_acl acl("/etc/jobs.acl"); // its text: see live_acl
 *   sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", qz::domain_handler);
 *
 *   if (!acl.refresh()) // before each request, or by a timer; the last good one stays
 *       log(qz::error::current().text());
 *   const auto alice = qz::requester::user("unix", "alice@head.example").in_groups(groups);
 *   const auto answer = qz::decide(acl.snapshot(), alice, wanted);
 *   if (!answer || !answer->allowed())
 *       deny(answer->explain()->view());
 *
 * The parts:
 *
 *   <qz/decide.hpp>     decide and granted; domain_handler, exact_handler
 *   <qz/answer.hpp>     requester, order; answer, which explains itself
 *   <qz/live_acl.hpp>   live_acl and its acl_snapshot
 *   <qz/acl_text.hpp>   to_text, from_text, same, stored_identity, append_entry; text
 *
 * Everything keeps the rules of <qz/acl.hpp> and <qz/acl.h>: codes, recorded errors, owners, threads; neither
 * exceptions nor RTTI are needed, and nothing throws. "Not recorded" marks failures that these headers detect
 * themselves, their code 6 included: they return the code and record no error. Const operations and functions
 * are "Threads: shared".
 */
#ifndef QZ_SERVICE_HPP
#define QZ_SERVICE_HPP

#include <qz/acl_text.hpp>
#include <qz/decide.hpp>
#include <qz/live_acl.hpp>

#endif
