// What depends on the database engine: how it is opened, where a writing transaction begins, how it
// is copied. Everything else is SQL that SQLite and PostgreSQL read alike: rows get their numbers
// by RETURNING, and a row that may be there already goes in with ON CONFLICT, because the two
// engines report a duplicate key in ways that SOCI does not make the same.
#ifndef QUENDEL_DESK_DATABASE_H_
#define QUENDEL_DESK_DATABASE_H_

#include <soci/soci.h>

#include <string>

namespace quendeldesk {

// Opens a session on the database in the file, which is made when there is none.
void OpenSession(soci::session& session, const std::string& file);

// Begins a transaction that nobody else's writing can make fail.
void BeginWriting(soci::session& session);
void Commit(soci::session& session);
void Rollback(soci::session& session);

// Makes the tables of an empty database. Throws when they are of a newer desk.
void PrepareSchema(soci::session& session);

// Writes a consistent copy of the database to a file, which must not be there.
void CopyDatabase(soci::session& session, const std::string& file);

// Throws when the engine finds the database damaged.
void CheckDatabase(soci::session& session);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_DATABASE_H_
