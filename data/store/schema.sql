-- The hub store: every table the hub's monitoring server keeps, as one SQLite file.
--
-- Table names are the server's qualified names, kept verbatim as quoted
-- identifiers ("O4SRV.TSITDESC"); the SQL client layer maps the dialect's
-- O4SRV.TSITDESC onto them. Declared column types give the descriptor type
-- codes and maximum lengths (lengths count bytes):
--   CHAR(n)      452 fixed character (values are read back padded with blanks)
--   VARCHAR(n)   448 varying character
--   NCHAR(n)     1022 fixed national (UTF-8) character
--   NVARCHAR(n)  1018 varying national (UTF-8) character
--   SMALLINT     500 (2 bytes)   USMALLINT 2 (2 bytes, unsigned)
--   INTEGER      496 (4 bytes)   UINTEGER  1006 (4 bytes, unsigned)
--   BIGINT       492 (8 bytes)   UBIGINT   1032 (8 bytes, unsigned)
--   DOUBLE       480 (8 bytes)   DECIMAL(p,s) 484 (carried as text)
-- Values are stored without padding. A literal longer than its column's
-- declared length is refused by the SQL client layer.
--
-- Tables whose name begins with CSIT_ are the client layer's own: no
-- statement sent through it may read or write them. SYSTEM.* tables are
-- read-only to such statements.

-- ---------------------------------------------------------------------------
-- Situations
-- ---------------------------------------------------------------------------

-- Situation definitions, one row per situation, keyed by its short name.
CREATE TABLE "O4SRV.TSITDESC" (
  SITNAME     CHAR(32) NOT NULL PRIMARY KEY,
  TEXT        NVARCHAR(1024) DEFAULT '',
  PDT         NVARCHAR(4000) DEFAULT '',
  CMD         NVARCHAR(2000) DEFAULT '*NONE',
  ADVISE      NVARCHAR(4000) DEFAULT '',
  AFFINITIES  VARCHAR(64) DEFAULT '',
  ALERTLIST   VARCHAR(4) DEFAULT '',
  AUTOSOPT    VARCHAR(16) DEFAULT '',
  AUTOSTART   VARCHAR(4) DEFAULT '*NO',
  DESTNODE    VARCHAR(32) DEFAULT '',
  HUB         CHAR(1) DEFAULT '',
  LOCFLAG     CHAR(2) DEFAULT '',
  LSTCCSID    VARCHAR(8) DEFAULT '',
  LSTDATE     CHAR(16) DEFAULT '',
  LSTRELEASE  VARCHAR(8) DEFAULT '',
  LSTUSRPRF   CHAR(10) DEFAULT '',
  NOTIFYARGS  VARCHAR(64) DEFAULT '',
  NOTIFYOPTS  VARCHAR(64) DEFAULT '',
  OBJECTLOCK  VARCHAR(16) DEFAULT '',
  PRNAMES     VARCHAR(256) DEFAULT '',
  QIBSCOPE    CHAR(1) DEFAULT '',
  REEV_DAYS   CHAR(3) DEFAULT '0',
  REEV_TIME   CHAR(6) DEFAULT '001500',
  REFLEXOK    CHAR(1) DEFAULT '',
  SENDMSGQ    VARCHAR(256) DEFAULT '*NONE',
  SITINFO     VARCHAR(256) DEFAULT '',
  SOURCE      VARCHAR(32) DEFAULT '',
  QIBCLASSID  CHAR(4) DEFAULT '5140'
);

-- Long (full) names of situations whose name does not fit the short form.
CREATE TABLE "O4SRV.TNAME" (
  ID          CHAR(32) NOT NULL PRIMARY KEY,
  FULLNAME    NVARCHAR(1024) NOT NULL,
  OBJCLASS    CHAR(4) DEFAULT '5140',
  LSTDATE     CHAR(16) DEFAULT '',
  LSTUSRPRF   CHAR(10) DEFAULT '',
  QIBCLASSID  CHAR(4) DEFAULT '2012'
);

-- Object access list: the distribution of situations to managed systems and
-- managed-system lists (NODEL); also receives activation requests (OPERATION).
CREATE TABLE "O4SRV.TOBJACCL" (
  OBJNAME     CHAR(32) NOT NULL,
  OBJCLASS    CHAR(4) DEFAULT '5140',
  NODEL       CHAR(32) NOT NULL,
  ACTIVATION  CHAR(1) DEFAULT '',
  HUB         CHAR(1) DEFAULT '',
  LOCFLAG     CHAR(2) DEFAULT '',
  LSTDATE     CHAR(16) DEFAULT '',
  LSTRELEASE  VARCHAR(8) DEFAULT '',
  LSTUSRPRF   CHAR(10) DEFAULT '',
  NETID       VARCHAR(8) DEFAULT '',
  OBJECTLOCK  VARCHAR(16) DEFAULT '',
  OPERATION   CHAR(1) DEFAULT '',
  QIBCLASSID  CHAR(4) DEFAULT '5535'
);

-- Event map: event-console slot rows of a situation.
CREATE TABLE "O4SRV.EVNTMAP" (
  ID          CHAR(32) NOT NULL,
  OBJCLASS    CHAR(4) DEFAULT '',
  SEQUENCE    VARCHAR(16) DEFAULT '',
  TYPE        VARCHAR(16) DEFAULT '',
  LSTDATE     CHAR(16) DEFAULT '',
  LSTUSRPRF   CHAR(10) DEFAULT '',
  LSTRELEASE  VARCHAR(8) DEFAULT '',
  LOCFLAG     CHAR(2) DEFAULT '',
  RESERVED    VARCHAR(64) DEFAULT '',
  MAP         NVARCHAR(8000) DEFAULT '',
  QIBCLASSID  CHAR(4) DEFAULT '2250'
);

-- Situation status history: one row per status change (raised Y,
-- acknowledged A, reset N, resurfaced E, other U).
CREATE TABLE "O4SRV.TSITSTSH" (
  SITNAME     CHAR(32) NOT NULL,
  ORIGINNODE  CHAR(32) DEFAULT '',
  ATOMIZE     NVARCHAR(128) DEFAULT '',
  TYPE        CHAR(1) DEFAULT '',
  NODE        CHAR(32) DEFAULT '',
  DELTASTAT   CHAR(1) DEFAULT '',
  RESULTS     VARCHAR(8000) DEFAULT '',
  LCLTMSTMP   CHAR(16) DEFAULT '',
  GBLTMSTMP   CHAR(16) DEFAULT '',
  LOCFLAG     CHAR(2) DEFAULT ''
);

-- The status history as the server presents it for reading.
CREATE VIEW "O4SRV.ISITSTSH" AS
  SELECT SITNAME, ORIGINNODE, ATOMIZE, TYPE, NODE, DELTASTAT, RESULTS,
         LCLTMSTMP, GBLTMSTMP, LOCFLAG
  FROM "O4SRV.TSITSTSH";

-- Situation templates: the templates (and their state) a situation belongs to.
CREATE TABLE "O4SRV.TTMPLSIT" (
  NAME        CHAR(32) NOT NULL,
  TEMPLATE    CHAR(32) NOT NULL,
  STATE       CHAR(16) DEFAULT ''
);

-- Managed objects of a template; NODE holds one node name or several
-- separated by commas (managed systems or managed-system lists).
CREATE TABLE "O4SRV.TMANOBJS" (
  NAME        VARCHAR(64) NOT NULL,
  TEMPLATE    CHAR(32) NOT NULL,
  NODE        VARCHAR(512) DEFAULT ''
);

-- Node lists (managed-system lists). NODETYPE M: a managed system member;
-- V: the hub's own entry. *ALL_LMS lists the managing servers, *HUB the hub.
-- No index on purpose: rows are read in the order they were written, and the
-- gateway stops reading a list at its V row.
CREATE TABLE "O4SRV.TNODELST" (
  NODELIST    CHAR(32) NOT NULL,
  NODE        CHAR(32) NOT NULL,
  NODETYPE    CHAR(1) DEFAULT 'M',
  LSTDATE     CHAR(16) DEFAULT '',
  LSTUSRPRF   CHAR(10) DEFAULT ''
);

-- Node status: one row per node (managing servers and agents). THRUNODE is
-- the managing server through which the node is reached; PRODUCT EM is the
-- hub's server, SM a remote managing server, other codes are agents.
CREATE TABLE "O4SRV.INODESTS" (
  NODE        CHAR(32) NOT NULL PRIMARY KEY,
  ORIGINNODE  CHAR(32) DEFAULT '',
  THRUNODE    CHAR(32) DEFAULT '',
  O4ONLINE    CHAR(1) DEFAULT 'N',
  PRODUCT     CHAR(2) DEFAULT '',
  VERSION     CHAR(8) DEFAULT '',
  HOSTADDR    VARCHAR(64) DEFAULT '',
  LSTDATE     CHAR(16) DEFAULT ''
);

-- Actions: commands for the local server (operator messages) and for remote
-- nodes (threshold overrides). ACTSECURE is the requesting user. A SELECT
-- naming a command records it here (see CSIT_TABLES.ACTION).
CREATE TABLE "O4SRV.CLACTLCL" (
  ACTSECURE   CHAR(10) DEFAULT '',
  CLCMD       VARCHAR(8000) DEFAULT '',
  NODE        CHAR(32) DEFAULT '',
  LSTDATE     CHAR(16) DEFAULT ''
);
CREATE TABLE "O4SRV.CLACTRMT" (
  ACTSECURE   CHAR(10) DEFAULT '',
  CLCMD       VARCHAR(8000) DEFAULT '',
  NODE        CHAR(32) DEFAULT '',
  LSTDATE     CHAR(16) DEFAULT ''
);

-- Event destinations of the event integration facility. DESTID is the id
-- a situation's SITINFO TDST item names; DEFAULTDEST Y marks the default.
CREATE TABLE "O4SRV.TEVTDEST" (
  DESTID      INTEGER NOT NULL PRIMARY KEY,
  NAME        VARCHAR(64) DEFAULT '',
  DESTTYPE    CHAR(1) DEFAULT 'T',
  DEFAULTDEST CHAR(1) DEFAULT 'N',
  HOSTS       VARCHAR(256) DEFAULT ''
);

-- ---------------------------------------------------------------------------
-- System tables (read-only to client statements)
-- ---------------------------------------------------------------------------

-- Server information, NAME/VALUE rows:
--   VERSION   the server version "VV.RR" (e.g. 06.30); the host's
--             configured version overwrites it when the store is opened.
--             Read it with: SELECT VALUE FROM SYSTEM.SERVERINFO WHERE NAME = "VERSION"
--   BUILD     the server build number
--   HUBNODE   the hub's own node name (what *HUB stands for)
--   VALIDATE  Y when the server validates users, N when not
--   EIF       Y when the event integration facility is enabled, N when not
--   NLS       Y when the server takes national-language text
CREATE TABLE "SYSTEM.SERVERINFO" (
  NAME        VARCHAR(32) NOT NULL PRIMARY KEY,
  VALUE       VARCHAR(256) DEFAULT ''
);

-- Applications installed at each node (node column NODE: AT routes to it).
CREATE TABLE "SYSTEM.SYSAPPLS" (
  NODE        CHAR(32) NOT NULL,
  APPL_NAME   CHAR(8) NOT NULL,
  VERSION     CHAR(10) DEFAULT '',
  LEVEL       CHAR(2) DEFAULT '',
  TIMESTAMP   CHAR(16) DEFAULT ''
);

-- Tables each application provides.
CREATE TABLE "SYSTEM.SYSTABLES" (
  APPL_NAME   CHAR(8) NOT NULL,
  TABL_NAME   CHAR(32) NOT NULL,
  DESCRIPTION VARCHAR(128) DEFAULT ''
);

-- ---------------------------------------------------------------------------
-- Agent application ZAG (a sample host agent): data tables with history.
-- ORIGINNODE is the agent; AT ("n") selects the rows of agent n and of the
-- agents reached through managing server n. The history tables hold the
-- samples written over time, newest last, with their WRITETIME.
-- Scaled columns: BUSYPCT, USERPCT, SYSPCT and CPUPCT are hundredths of a
-- percent (scale 2); USEDPCT is whole percent. DISK.STATUS: 0 normal,
-- 1 warning, 2 full. PROCESS.STATE: R running, S sleeping, Z zombie.
-- ---------------------------------------------------------------------------

CREATE TABLE "ZAG.CPU" (
  ORIGINNODE  CHAR(32) NOT NULL,
  TIMESTAMP   CHAR(16) DEFAULT '',
  CPUID       SMALLINT DEFAULT 0,
  BUSYPCT     INTEGER DEFAULT 0,
  USERPCT     INTEGER DEFAULT 0,
  SYSPCT      INTEGER DEFAULT 0
);
CREATE TABLE "ZAG.CPU_HIST" (
  WRITETIME   CHAR(16) NOT NULL,
  ORIGINNODE  CHAR(32) NOT NULL,
  TIMESTAMP   CHAR(16) DEFAULT '',
  CPUID       SMALLINT DEFAULT 0,
  BUSYPCT     INTEGER DEFAULT 0,
  USERPCT     INTEGER DEFAULT 0,
  SYSPCT      INTEGER DEFAULT 0
);

CREATE TABLE "ZAG.DISK" (
  ORIGINNODE  CHAR(32) NOT NULL,
  TIMESTAMP   CHAR(16) DEFAULT '',
  MOUNT       VARCHAR(64) NOT NULL,
  FSTYPE      CHAR(8) DEFAULT '',
  SIZEMB      BIGINT DEFAULT 0,
  FREEMB      BIGINT DEFAULT 0,
  USEDPCT     SMALLINT DEFAULT 0,
  STATUS      INTEGER DEFAULT 0
);
CREATE TABLE "ZAG.DISK_HIST" (
  WRITETIME   CHAR(16) NOT NULL,
  ORIGINNODE  CHAR(32) NOT NULL,
  TIMESTAMP   CHAR(16) DEFAULT '',
  MOUNT       VARCHAR(64) NOT NULL,
  FSTYPE      CHAR(8) DEFAULT '',
  SIZEMB      BIGINT DEFAULT 0,
  FREEMB      BIGINT DEFAULT 0,
  USEDPCT     SMALLINT DEFAULT 0,
  STATUS      INTEGER DEFAULT 0
);

CREATE TABLE "ZAG.PROCESS" (
  ORIGINNODE  CHAR(32) NOT NULL,
  TIMESTAMP   CHAR(16) DEFAULT '',
  PID         INTEGER NOT NULL,
  NAME        VARCHAR(64) DEFAULT '',
  STATE       CHAR(1) DEFAULT 'S',
  RSSKB       BIGINT DEFAULT 0,
  CPUPCT      INTEGER DEFAULT 0
);
CREATE TABLE "ZAG.PROCESS_HIST" (
  WRITETIME   CHAR(16) NOT NULL,
  ORIGINNODE  CHAR(32) NOT NULL,
  TIMESTAMP   CHAR(16) DEFAULT '',
  PID         INTEGER NOT NULL,
  NAME        VARCHAR(64) DEFAULT '',
  STATE       CHAR(1) DEFAULT 'S',
  RSSKB       BIGINT DEFAULT 0,
  CPUPCT      INTEGER DEFAULT 0
);

-- ---------------------------------------------------------------------------
-- Warehouse: snapshot records handed over by history export.
-- ---------------------------------------------------------------------------
CREATE TABLE "WAREHOUSE.SNAPSHOT" (
  USERID      CHAR(16) DEFAULT '',
  WRITETIME   CHAR(16) DEFAULT '',
  HOSTNAME    VARCHAR(256) DEFAULT '',
  XMLDATA     VARCHAR(32000) DEFAULT ''
);

-- ---------------------------------------------------------------------------
-- The client layer's own tables
-- ---------------------------------------------------------------------------

-- Routing, history and actions of the tables: NODECOLUMN is the column
-- AT (...) compares with the named nodes (empty: AT does not limit the rows);
-- VIATHRU 1 also takes the rows of nodes whose O4SRV.INODESTS THRUNODE is
-- one of the named nodes; HISTTABLE is the table HISTORY() reads. ACTION
-- names the command column of an action table: a SELECT on it whose WHERE
-- clause is a conjunction of COLUMN = value terms, one of them naming the
-- command, first records those values as a new row (the command is issued),
-- and so answers with the recorded command.
CREATE TABLE CSIT_TABLES (
  TABLENAME   VARCHAR(64) NOT NULL PRIMARY KEY,
  NODECOLUMN  VARCHAR(32) DEFAULT '',
  VIATHRU     INTEGER DEFAULT 0,
  HISTTABLE   VARCHAR(64) DEFAULT '',
  ACTION      VARCHAR(32) DEFAULT ''
);
INSERT INTO CSIT_TABLES (TABLENAME, NODECOLUMN, VIATHRU, HISTTABLE, ACTION) VALUES
  ('SYSTEM.SYSAPPLS', 'NODE', 0, '', ''),
  ('ZAG.CPU', 'ORIGINNODE', 1, 'ZAG.CPU_HIST', ''),
  ('ZAG.DISK', 'ORIGINNODE', 1, 'ZAG.DISK_HIST', ''),
  ('ZAG.PROCESS', 'ORIGINNODE', 1, 'ZAG.PROCESS_HIST', ''),
  ('O4SRV.TSITSTSH', '', 0, 'O4SRV.TSITSTSH', ''),
  ('O4SRV.ISITSTSH', '', 0, 'O4SRV.ISITSTSH', ''),
  ('O4SRV.CLACTLCL', '', 0, '', 'CLCMD'),
  ('O4SRV.CLACTRMT', '', 0, '', 'CLCMD');

-- Users the server validates: Argon2id password hashes (libsodium string
-- form). ENABLED N refuses the user's logon.
CREATE TABLE CSIT_USERS (
  USERID      VARCHAR(16) NOT NULL PRIMARY KEY,
  PWHASH      VARCHAR(128) NOT NULL,
  ENABLED     CHAR(1) DEFAULT 'Y'
);
