-- Seed rows of a new hub store: a hub (HUB_MAIN) with one remote managing
-- server (REMOTE_EAST) and three agents of application ZAG: alpha:ZAG and
-- gamma:ZAG report to the hub, beta:ZAG to REMOTE_EAST; gamma:ZAG is
-- offline. A few base situations with templates, managed objects and
-- distributions, node lists, event destinations and agent data with history.
-- Timestamps have the form CYYMMDDHHMMSSmmm.

INSERT INTO "SYSTEM.SERVERINFO" (NAME, VALUE) VALUES
  ('VERSION', '06.30'),
  ('BUILD', '2026011'),
  ('HUBNODE', 'HUB_MAIN'),
  ('VALIDATE', 'Y'),
  ('EIF', 'Y'),
  ('NLS', 'Y');

-- Topology -------------------------------------------------------------------

INSERT INTO "O4SRV.INODESTS" (NODE, ORIGINNODE, THRUNODE, O4ONLINE, PRODUCT, VERSION, HOSTADDR, LSTDATE) VALUES
  ('HUB_MAIN',    'HUB_MAIN',    'HUB_MAIN',    'Y', 'EM', '06.30.00', 'ip:127.0.0.1',  '1260115090000000'),
  ('REMOTE_EAST', 'REMOTE_EAST', 'HUB_MAIN',    'Y', 'SM', '06.30.00', 'ip:127.0.0.2',  '1260115090100000'),
  ('alpha:ZAG',   'alpha:ZAG',   'HUB_MAIN',    'Y', 'ZG', '01.02.00', 'ip:127.0.1.1',  '1260115090200000'),
  ('beta:ZAG',    'beta:ZAG',    'REMOTE_EAST', 'Y', 'ZG', '01.02.00', 'ip:127.0.1.2',  '1260115090300000'),
  ('gamma:ZAG',   'gamma:ZAG',   'HUB_MAIN',    'N', 'ZG', '01.01.00', 'ip:127.0.1.3',  '1260114180000000');

-- Managed-system lists; the hub's own V entry comes last.
INSERT INTO "O4SRV.TNODELST" (NODELIST, NODE, NODETYPE, LSTDATE, LSTUSRPRF) VALUES
  ('*ZAG_HOSTS', 'alpha:ZAG',   'M', '1260110120000000', 'sysadmin'),
  ('*ZAG_HOSTS', 'beta:ZAG',    'M', '1260110120000000', 'sysadmin'),
  ('*ZAG_HOSTS', 'gamma:ZAG',   'M', '1260110120000000', 'sysadmin'),
  ('*EAST',      'beta:ZAG',    'M', '1260110120000000', 'sysadmin'),
  ('*ALL_LMS',   'HUB_MAIN',    'M', '1260110120000000', 'sysadmin'),
  ('*ALL_LMS',   'REMOTE_EAST', 'M', '1260110120000000', 'sysadmin'),
  ('*HUB',       'HUB_MAIN',    'V', '1260110120000000', 'sysadmin');

INSERT INTO "SYSTEM.SYSAPPLS" (NODE, APPL_NAME, VERSION, LEVEL, TIMESTAMP) VALUES
  ('HUB_MAIN',    'ZAG',   '01.02.00', '00', '1260101000000000'),
  ('HUB_MAIN',    'O4SRV', '06.30.00', '00', '1260101000000000'),
  ('REMOTE_EAST', 'ZAG',   '01.02.00', '00', '1260101000000000'),
  ('alpha:ZAG',   'ZAG',   '01.02.00', '00', '1260101000000000'),
  ('beta:ZAG',    'ZAG',   '01.02.00', '00', '1260101000000000'),
  ('gamma:ZAG',   'ZAG',   '01.01.00', '00', '1260101000000000');

INSERT INTO "SYSTEM.SYSTABLES" (APPL_NAME, TABL_NAME, DESCRIPTION) VALUES
  ('ZAG', 'CPU',     'Processor utilisation per processor'),
  ('ZAG', 'DISK',    'File system space per mount point'),
  ('ZAG', 'PROCESS', 'Processes and their resource use');

-- Event destinations ---------------------------------------------------------

INSERT INTO "O4SRV.TEVTDEST" (DESTID, NAME, DESTTYPE, DEFAULTDEST, HOSTS) VALUES
  (0, 'Default event receiver', 'T', 'Y', 'events.example.invalid:5529'),
  (1, 'Operations bridge',      'T', 'N', 'bridge.example.invalid:5529');

-- Situations -----------------------------------------------------------------

INSERT INTO "O4SRV.TSITDESC" (SITNAME, TEXT, PDT, CMD, ADVISE, AFFINITIES, ALERTLIST, AUTOSOPT,
    AUTOSTART, DESTNODE, HUB, LOCFLAG, LSTCCSID, LSTDATE, LSTRELEASE, LSTUSRPRF, NOTIFYARGS,
    NOTIFYOPTS, OBJECTLOCK, PRNAMES, QIBSCOPE, REEV_DAYS, REEV_TIME, REFLEXOK, SENDMSGQ, SITINFO,
    SOURCE, QIBCLASSID) VALUES
  ('ZAG_CPU_Busy', 'Processor busy above 90 percent',
   '*IF *VALUE ZAG_CPU.Busy_Percent *GT 9000', '*NONE',
   'Find the processes using the processor and consider moving work elsewhere.',
   '%ZAG.HOSTAGENT          000000000001', '*NO', 'SAY', '*YES', '', '', '', 'en_US',
   '1260110120000000', 'V120', '&QIBUSER', '_Z_', 'Y', '', '', 'A', '0', '000500', '', '*NONE',
   'SEV=Warning;TFWD=Y;TDST=0;ATOM=CPUID;', 'ZAG', '5140'),
  ('ZAG_Disk_Full', 'File system nearly full',
   '*IF *VALUE ZAG_DISK.Used_Percent *GE 95', '*NONE',
   'Remove old files or grow the file system.',
   '%ZAG.HOSTAGENT          000000000002', '*NO', 'SAY', '*YES', '', '', '', 'en_US',
   '1260110120000000', 'V120', '&QIBUSER', '_Z_', 'Y', '', '', 'A', '0', '001500', '', '*NONE',
   'SEV=Critical;TFWD=Y;TDST=0,1;ATOM=MOUNT;', 'ZAG', '5140'),
  ('ZAG_Proc_Missing', 'A required process is not running',
   '*IF *MISSING ZAG_PROCESS.Name *EQ (''sshd'',''crond'')', 'echo missing process on &{ZAG_PROCESS.Origin_Node}',
   'Restart the process.',
   '%ZAG.HOSTAGENT          000000000004', '*NO', 'SAY', '*NO', '', '', '', 'en_US',
   '1260110120000000', 'V120', '&QIBUSER', '_Z_', 'Y', '', '', 'A', '0', '010000', '', '*NONE',
   'SEV=Minor;TFWD=N;', 'ZAG', '5140'),
  ('ZAG_Mem_Pressure_East_0001', 'Memory pressure on the eastern hosts',
   '*IF *VALUE ZAG_PROCESS.Resident_KB *GT 4000000', '*NONE', '',
   '%ZAG.HOSTAGENT          000000000004', '*NO', 'SAY', '*NO', '', '', '', 'en_US',
   '1260110120000000', 'V120', '&QIBUSER', '_Z_', 'Y', '', '', 'A', '0', '001500', '', '*NONE',
   'SEV=Warning;', 'ZAG', '5140'),
  ('UADVISOR_ZAG_CPU', 'Data collection for ZAG.CPU history',
   '*IF *VALUE ZAG_CPU.CPU_ID *GE 0', '*NONE', '',
   '%ZAG.HOSTAGENT          000000000001', '*NO', '', '*SYN', '', '', '', 'en_US',
   '1260110120000000', 'V120', '&QIBUSER', '', '', '', '', 'A', '0', '001500', '', '*NONE',
   '', 'ZAG', '5140');

INSERT INTO "O4SRV.TNAME" (ID, FULLNAME, OBJCLASS, LSTDATE, LSTUSRPRF, QIBCLASSID) VALUES
  ('ZAG_Mem_Pressure_East_0001', 'ZAG memory pressure on all production hosts of the eastern region',
   '5140', '1260110120000000', '&QIBUSER', '2012');

INSERT INTO "O4SRV.TOBJACCL" (OBJNAME, OBJCLASS, NODEL, HUB, LSTUSRPRF, QIBCLASSID) VALUES
  ('ZAG_CPU_Busy',               '5140', '*ZAG_HOSTS', 'Y', '&QIBUSER', '5535'),
  ('ZAG_Disk_Full',              '5140', 'alpha:ZAG',  'Y', '&QIBUSER', '5535'),
  ('ZAG_Disk_Full',              '5140', 'beta:ZAG',   'Y', '&QIBUSER', '5535'),
  ('ZAG_Proc_Missing',           '5140', '*ZAG_HOSTS', 'Y', '&QIBUSER', '5535'),
  ('ZAG_Mem_Pressure_East_0001', '5140', '*EAST',      'Y', '&QIBUSER', '5535'),
  ('UADVISOR_ZAG_CPU',           '5140', '*ZAG_HOSTS', 'Y', '&QIBUSER', '5535');

INSERT INTO "O4SRV.EVNTMAP" (ID, OBJCLASS, SEQUENCE, TYPE, LSTDATE, LSTUSRPRF, LSTRELEASE, LOCFLAG,
    RESERVED, MAP, QIBCLASSID) VALUES
  ('ZAG_Disk_Full', '5140', '1', 'S', '1260110120000000', '&QIBUSER', 'V120', '', '',
   '<situation name="ZAG_Disk_Full"><slot name="mount" attr="ZAG_DISK.Mount_Point"/></situation>', '2250');

-- Templates and managed objects.
INSERT INTO "O4SRV.TTMPLSIT" (NAME, TEMPLATE, STATE) VALUES
  ('ZAG_CPU_Busy',     'ZAG_Host_Health', 'Warning'),
  ('ZAG_Disk_Full',    'ZAG_Host_Health', 'Critical'),
  ('ZAG_Disk_Full',    'ZAG_Storage',     'Critical'),
  ('ZAG_Proc_Missing', 'ZAG_Host_Health', 'Minor');

INSERT INTO "O4SRV.TMANOBJS" (NAME, TEMPLATE, NODE) VALUES
  ('Production hosts', 'ZAG_Host_Health', '*ZAG_HOSTS'),
  ('Storage east',     'ZAG_Storage',     'beta:ZAG,gamma:ZAG');

-- Situation status history: ZAG_Disk_Full raised on beta:ZAG, CPU busy
-- raised and reset on alpha:ZAG.
INSERT INTO "O4SRV.TSITSTSH" (SITNAME, ORIGINNODE, ATOMIZE, TYPE, NODE, DELTASTAT, RESULTS,
    LCLTMSTMP, GBLTMSTMP, LOCFLAG) VALUES
  ('ZAG_Disk_Full', 'beta:ZAG', '/var', '0', 'REMOTE_EAST', 'Y',
   '*PREDICATE=ZAG_DISK.Used_Percent >= 95;ZAG_DISK.MOUNT=/var;ZAG_DISK.USEDPCT=97~',
   '1260115091500000', '1260115091500000', '  '),
  ('ZAG_CPU_Busy', 'alpha:ZAG', '0', '0', 'HUB_MAIN', 'Y',
   '*PREDICATE=ZAG_CPU.Busy_Percent > 9000;ZAG_CPU.CPUID=0;ZAG_CPU.BUSYPCT=9512~',
   '1260115092000000', '1260115092000000', '  '),
  ('ZAG_CPU_Busy', 'alpha:ZAG', '0', '0', 'HUB_MAIN', 'N', 'USR=sysadmin~',
   '1260115092500000', '1260115092500000', '  ');

-- Agent data -----------------------------------------------------------------

INSERT INTO "ZAG.CPU" (ORIGINNODE, TIMESTAMP, CPUID, BUSYPCT, USERPCT, SYSPCT) VALUES
  ('alpha:ZAG', '1260115093000000', 0, 9512, 8010, 1502),
  ('alpha:ZAG', '1260115093000000', 1, 4020, 3000, 1020),
  ('beta:ZAG',  '1260115093000000', 0, 1250, 1000, 250),
  ('gamma:ZAG', '1260114175900000', 0, 300, 200, 100);

INSERT INTO "ZAG.CPU_HIST" (WRITETIME, ORIGINNODE, TIMESTAMP, CPUID, BUSYPCT, USERPCT, SYSPCT) VALUES
  ('1260115081500000', 'alpha:ZAG', '1260115081500000', 0, 2210, 2000, 210),
  ('1260115083000000', 'alpha:ZAG', '1260115083000000', 0, 5105, 4500, 605),
  ('1260115084500000', 'alpha:ZAG', '1260115084500000', 0, 9020, 8000, 1020),
  ('1260115081500000', 'beta:ZAG',  '1260115081500000', 0, 1100, 1000, 100),
  ('1260115083000000', 'beta:ZAG',  '1260115083000000', 0, 1300, 1100, 200);

INSERT INTO "ZAG.DISK" (ORIGINNODE, TIMESTAMP, MOUNT, FSTYPE, SIZEMB, FREEMB, USEDPCT, STATUS) VALUES
  ('alpha:ZAG', '1260115093000000', '/',    'ext4', 51200,  20480, 60, 0),
  ('alpha:ZAG', '1260115093000000', '/var', 'ext4', 102400, 10240, 90, 1),
  ('beta:ZAG',  '1260115093000000', '/',    'xfs',  51200,  25600, 50, 0),
  ('beta:ZAG',  '1260115093000000', '/var', 'xfs',  20480,  614,   97, 2),
  ('gamma:ZAG', '1260114175900000', '/',    'ext4', 25600,  12800, 50, 0);

INSERT INTO "ZAG.DISK_HIST" (WRITETIME, ORIGINNODE, TIMESTAMP, MOUNT, FSTYPE, SIZEMB, FREEMB, USEDPCT, STATUS) VALUES
  ('1260115080000000', 'beta:ZAG', '1260115080000000', '/var', 'xfs', 20480, 2048, 90, 1),
  ('1260115084500000', 'beta:ZAG', '1260115084500000', '/var', 'xfs', 20480, 1024, 95, 2),
  ('1260115080000000', 'alpha:ZAG', '1260115080000000', '/var', 'ext4', 102400, 12288, 88, 0);

INSERT INTO "ZAG.PROCESS" (ORIGINNODE, TIMESTAMP, PID, NAME, STATE, RSSKB, CPUPCT) VALUES
  ('alpha:ZAG', '1260115093000000', 1,    'init',  'S', 10240,   0),
  ('alpha:ZAG', '1260115093000000', 812,  'sshd',  'S', 7168,    10),
  ('alpha:ZAG', '1260115093000000', 4242, 'batch', 'R', 4194304, 8800),
  ('beta:ZAG',  '1260115093000000', 1,    'init',  'S', 9216,    0),
  ('beta:ZAG',  '1260115093000000', 733,  'crond', 'S', 3072,    0),
  ('gamma:ZAG', '1260114175900000', 1,    'init',  'S', 9216,    0);

INSERT INTO "ZAG.PROCESS_HIST" (WRITETIME, ORIGINNODE, TIMESTAMP, PID, NAME, STATE, RSSKB, CPUPCT) VALUES
  ('1260115083000000', 'alpha:ZAG', '1260115083000000', 4242, 'batch', 'R', 2097152, 4500),
  ('1260115084500000', 'alpha:ZAG', '1260115084500000', 4242, 'batch', 'R', 3145728, 7000);
