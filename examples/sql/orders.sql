-- A small shop: many rows, indexes, joins, groups and texts.
CREATE TABLE customer(id INTEGER PRIMARY KEY, name TEXT, city TEXT);
CREATE TABLE purchase(id INTEGER PRIMARY KEY, customer INT, item TEXT, price REAL, day INT);
BEGIN;
WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 20000)
INSERT INTO customer SELECT i, printf('customer %05d', i * 7919 % 20011), 'city ' || (i % 97) FROM n;
WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 60000)
INSERT INTO purchase
SELECT i, i * 7919 % 20000 + 1, 'item ' || (i * 31 % 503), i % 1000 / 8.0, i % 365 FROM n;
COMMIT;
CREATE INDEX purchase_customer ON purchase(customer);
CREATE INDEX customer_city ON customer(city, name);

SELECT count(*), sum(price), min(item), max(item) FROM purchase;
SELECT city, count(*), round(sum(price), 2) AS total
FROM customer JOIN purchase ON purchase.customer = customer.id
GROUP BY city ORDER BY total DESC, city LIMIT 5;
SELECT name, group_concat(item, ','), NULL, x'4142'
FROM customer JOIN purchase ON purchase.customer = customer.id
WHERE city = 'city 13' GROUP BY name ORDER BY name LIMIT 3;
UPDATE purchase SET price = price * 1.25 WHERE day BETWEEN 100 AND 120;
DELETE FROM purchase WHERE item LIKE '%7';
SELECT day % 7, count(DISTINCT customer), round(avg(price), 3) FROM purchase GROUP BY 1 ORDER BY 1;
SELECT upper(substr(name, 1, 8)) || hex(id), length(city) FROM customer WHERE id % 4999 = 0;
WITH RECURSIVE tree(id, depth) AS
    (SELECT 1, 0 UNION ALL SELECT id * 2 + k, depth + 1 FROM tree, (SELECT 0 AS k UNION SELECT 1)
     WHERE depth < 12)
SELECT depth, count(*), max(id) FROM tree GROUP BY depth;
