-- The first error ends the run, with the line of its statement.
-- expect-error: error.sql:6: no such table: nowhere
SELECT 1, 'two', NULL, 3.0;
SELECT 2;

SELECT * FROM nowhere;
SELECT 3;
